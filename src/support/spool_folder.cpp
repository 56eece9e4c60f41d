// SPDX-License-Identifier: Apache-2.0
// Names, writes, reads and removes the files of the spool.
#include "support/spool_folder.h"

#include <dirent.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <memory>
#include <string_view>

#include "platform/file_store.h"

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
  return Done();
}

std::vector<SpoolFolder::Name> SpoolFolder::names() const {
  static_cast<void>(platform::removeUnfinishedFiles(_directory));
  std::vector<Name> names;
  const std::unique_ptr<DIR, int (*)(DIR*)> opened(::opendir(_directory.c_str()), ::closedir);
  while (const dirent* entry = opened ? ::readdir(opened.get()) : nullptr) {
    if (const auto name = named(entry->d_name)) names.push_back(*name);
  }
  std::sort(names.begin(), names.end());
  return names;
}

Result<Done, std::string> SpoolFolder::write(const Name& name, std::string_view file) const {
  auto written = _files.replace(pathOf(name), file, 0600);
  // The directory may have gone, or could not be made before.
  if (!written && written.error().kind == platform::FileFailure::Kind::notFound && make())
    written = _files.replace(pathOf(name), file, 0600);
  if (written) return Done();
  // The file may be there, and its name not on disk.
  remove(name);
  return Failure{std::move(written.error().description)};
}

bool SpoolFolder::rewrite(const Name& name, std::string_view file) const {
  return _files.replace(pathOf(name), file, 0600).ok();
}

SpoolFolder::Read SpoolFolder::read(const Name& name) const {
  const auto file = _files.read(pathOf(name), kLargestFile);
  if (!file) return {std::nullopt, 0, false, file.error().passes()};
  auto entry = readSpoolEntry(file.value());
  if (!entry || entry->id != name.id || entry->order != name.order) return {std::nullopt, 0, true, false};
  return {std::move(entry), file.value().size(), false, false};
}

void SpoolFolder::remove(const Name& name) const {
  static_cast<void>(_files.unlink(pathOf(name)));
}

SpoolFolder::Removed SpoolFolder::removeAll() const {
  Removed removed;
  for (const Name& name : names()) {
    const auto entry = read(name).entry;
    removed.posts += entry ? 1 : 0;
    removed.events += entry ? entry->events : 0;
    removed.torn += entry ? 0 : 1;
    remove(name);
  }
  ::rmdir(_directory.c_str());
  return removed;
}

}  // namespace veltrad::support
