// SPDX-License-Identifier: Apache-2.0
// Names, writes, reads and removes the files of the spool.
#include "support/spool_folder.h"

#include <dirent.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <memory>
#include <new>
#include <string_view>
#include <system_error>

#include "platform/file_store.h"
#include "support/spool_age.h"

namespace veltrad::support {

namespace {

constexpr std::size_t kOrderDigits = 16;
constexpr std::size_t kLargestFile = 80u << 20;

std::string fileName(const SpoolFolder::Name& name) {
  return fmt::format("{:016x}.{}", name.order, textOf(name.id));
}

// ORDER.ID
std::optional<SpoolFolder::Name> named(std::string_view text) {
  if (text.size() <= kOrderDigits || text[kOrderDigits] != '.') return std::nullopt;
  SpoolFolder::Name name;
  const auto id = postIDOf(text.substr(kOrderDigits + 1));
  const auto [end, error] = std::from_chars(text.data(), text.data() + kOrderDigits, name.order, 16);
  if (!id || error != std::errc() || end != text.data() + kOrderDigits) return std::nullopt;
  name.id = *id;
  return name;
}

}  // namespace

std::string SpoolFolder::pathOf(const Name& name) const {
  return _directory + "/" + fileName(name);
}

Result<Done, std::string> SpoolFolder::make() const {
  if (const auto made = platform::makeDirectories(_directory, 0700); !made)
    return Failure{made.error().description};
  struct stat status {};
  if (::stat(_directory.c_str(), &status) == 0 && (status.st_mode & 0777) == 0700) return Done();
  if (::chmod(_directory.c_str(), 0700) == 0) return Done();
  return Failure{_directory + ": others may read it, and its mode cannot be made 0700: " +
                 std::generic_category().message(errno)};
}

std::optional<std::vector<SpoolFolder::Name>> SpoolFolder::names(double now) const {
  std::vector<Name> names;
  const std::unique_ptr<DIR, int (*)(DIR*)> opened(::opendir(_directory.c_str()), ::closedir);
  if (!opened) return errno == ENOENT ? std::optional(names) : std::nullopt;
  for (;;) {
    errno = 0;
    const dirent* entry = ::readdir(opened.get());
    if (!entry && errno != 0) return std::nullopt;
    if (!entry) break;
    if (const auto name = named(entry->d_name)) names.push_back(*name);
  }
  static_cast<void>(platform::removeUnfinishedFiles(_directory));
  std::sort(names.begin(), names.end());
  bringNamesBack(names, now);
  return names;
}

// If the power fails before the rename is on disk, the next start finds the old name again.
void SpoolFolder::bringNamesBack(std::vector<Name>& names, double now) const {
  if (names.empty() || static_cast<double>(names.back().order) <= now * 1e6) return;
  std::vector<std::uint64_t> orders;
  orders.reserve(names.size());
  for (const Name& name : names) orders.push_back(name.order);
  bringBack(orders, now);
  for (std::size_t i = 0; i < names.size(); ++i) {
    const Name better{orders[i], names[i].id};
    if (better.order != names[i].order && ::rename(pathOf(names[i]).c_str(), pathOf(better).c_str()) == 0)
      names[i] = better;
  }
}

Result<Done, std::string> SpoolFolder::write(const Name& name, std::string_view file) const {
  auto written = _files.replace(pathOf(name), file, 0600);
  // The directory may have gone, or could not be made before.
  if (!written && written.error().kind == platform::FileFailure::Kind::notFound && make())
    written = _files.replace(pathOf(name), file, 0600);
  if (written) return Done();
  return Failure{std::move(written.error().description)};
}

SpoolFolder::Read SpoolFolder::read(const Name& name) const {
  try {
    Read found = readFile(name);
    if (!found.passes) return found;
  } catch (const std::bad_alloc&) {
  }
  struct stat status {};
  const bool found = ::stat(pathOf(name).c_str(), &status) == 0;
  return {std::nullopt, found ? static_cast<std::size_t>(status.st_size) : 0, false, true};
}

SpoolFolder::Read SpoolFolder::readFile(const Name& name) const {
  const auto file = _files.read(pathOf(name), kLargestFile);
  if (!file && file.error().passes()) return {std::nullopt, 0, false, true};
  if (!file) return {std::nullopt, 0, file.error().kind != platform::FileFailure::Kind::notFound, false};
  auto entry = readSpoolEntry(file.value());
  if (!entry || entry->id != name.id) return {std::nullopt, 0, true, false};
  entry->order = name.order;
  return {std::move(entry), file.value().size(), false, false};
}

bool SpoolFolder::remove(const Name& name) const {
  const std::string path = pathOf(name);
  if (_files.unlink(path)) return true;
  // A read-only disk reports this error before it checks whether the file exists.
  struct stat status {};
  return ::lstat(path.c_str(), &status) != 0 && (errno == ENOENT || errno == ENOTDIR);
}

SpoolFolder::Removed SpoolFolder::removeAll() const {
  Removed removed;
  const auto all = names(0);
  removed.all = all.has_value();
  for (const Name& name : all.value_or(std::vector<Name>())) {
    const Read found = read(name);
    if (!remove(name)) {
      removed.all = false;
      continue;
    }
    removed.posts += found.entry ? 1 : 0;
    removed.events += found.entry ? found.entry->events : 0;
    removed.torn += found.torn ? 1 : 0;
  }
  ::rmdir(_directory.c_str());
  return removed;
}

}  // namespace veltrad::support
