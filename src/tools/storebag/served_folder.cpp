// SPDX-License-Identifier: Apache-2.0
// Replaces and keeps the files of a folder that a web server reads at any time.
#include "storebag/served_folder.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <filesystem>

#include "config/storebag_container.h"
#include "platform/file_store.h"

namespace veltrad::storebag {

namespace {

namespace fs = std::filesystem;

constexpr unsigned kServedMode = 0644;
// The number of kept storebags for each name.
constexpr std::size_t kMostKept = 10;

using Bytes = std::optional<std::string>;

Failure<std::string> failureAt(const std::string& path, int error) {
  return Failure{path + ": " + std::strerror(error)};
}

// Absent if there is no such file. That it cannot be read is no answer.
Result<Bytes, std::string> bytesOf(const std::string& path) {
  auto read = platform::DiskFileStore().read(path, config::kStorebagMostContainerBytes);
  if (read) return Bytes(std::move(read).value());
  if (read.error().kind == platform::FileFailure::Kind::notFound) return Bytes();
  return Failure{read.error().description};
}

bool isNumber(const std::string& text) {
  return !text.empty() && text.size() < 19 && text.find_first_not_of("0123456789") == std::string::npos;
}

}  // namespace

Result<ServedFolder, std::string> ServedFolder::open(const std::string& directory, bool make) {
  const std::string before = directory + "/.before";
  if (make) {
    if (auto made = platform::makeDirectories(before); !made) return Failure{made.error().description};
  }
  FileDescriptor lock(::open(before.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!lock.isOpen() && errno == ENOENT) return Failure{directory + ": nothing was published there"};
  if (!lock.isOpen()) return failureAt(before, errno);
  while (::flock(lock.get(), LOCK_EX) != 0) {
    if (errno != EINTR) return failureAt(before, errno);
  }
  return ServedFolder(directory, std::move(lock));
}

Result<Bytes, std::string> ServedFolder::served(const std::string& name) const {
  return bytesOf(pathOf(name));
}

Result<std::vector<std::uint64_t>, std::string> ServedFolder::keptNumbers(const std::string& name) const {
  std::vector<std::uint64_t> numbers;
  std::error_code error;
  fs::directory_iterator entry(keptPath(name), error);
  if (error == std::errc::no_such_file_or_directory) return numbers;
  for (; !error && entry != fs::directory_iterator(); entry.increment(error)) {
    const std::string text = entry->path().filename().string();
    if (isNumber(text)) numbers.push_back(std::stoull(text));
  }
  if (error) return failureAt(keptPath(name), error.value());
  std::sort(numbers.begin(), numbers.end());
  return numbers;
}

Result<std::optional<ServedFolder::Kept>, std::string> ServedFolder::before(const std::string& name) const {
  const auto now = served(name);
  if (!now) return Failure{now.error()};
  const auto numbers = keptNumbers(name);
  if (!numbers) return Failure{numbers.error()};
  for (auto number = numbers.value().rbegin(); number != numbers.value().rend(); ++number) {
    auto bytes = bytesOf(keptPath(name, *number));
    if (!bytes) return Failure{bytes.error()};
    if (bytes.value() && bytes.value() != now.value())
      return std::optional(Kept{*number, std::move(*bytes.value())});
  }
  return std::optional<Kept>();
}

Result<Done, std::string> ServedFolder::put(const std::string& name, const std::string& bytes) const {
  const auto now = served(name);
  if (!now) return Failure{now.error()};
  if (now.value() == bytes) return Done();
  if (now.value()) {
    if (auto kept = keep(name, *now.value()); !kept) return kept;
  }
  return replace(name, bytes);
}

Result<Done, std::string> ServedFolder::keep(const std::string& name, const std::string& bytes) const {
  platform::DiskFileStore files;
  const auto found = keptNumbers(name);
  if (!found) return Failure{found.error()};
  const std::vector<std::uint64_t>& numbers = found.value();
  // An attempt that failed after this has kept it already.
  if (!numbers.empty()) {
    const auto newest = bytesOf(keptPath(name, numbers.back()));
    if (!newest) return Failure{newest.error()};
    if (newest.value() == bytes) return Done();
  }
  if (auto made = platform::makeDirectories(keptPath(name)); !made) return Failure{made.error().description};
  const std::string next = keptPath(name, numbers.empty() ? 1 : numbers.back() + 1);
  if (auto written = files.replace(next, bytes, kServedMode); !written)
    return Failure{written.error().description};
  for (std::size_t at = 0; at + kMostKept <= numbers.size(); ++at)
    (void)files.unlink(keptPath(name, numbers[at]));
  return Done();
}

// Daemons ask by "Last-Modified", which has whole seconds: of two within one second they would miss the
// second. The file gets its time before its name, so that it is never served with another.
Result<Done, std::string> ServedFolder::replace(const std::string& name, const std::string& bytes) const {
  platform::DiskFileStore files;
  const std::string path = pathOf(name), next = pathOf("." + name + ".next");
  std::time_t time = std::time(nullptr);
  struct stat now {};
  if (::stat(path.c_str(), &now) == 0) {
    time = std::max(time, now.st_mtime + 1);
  } else if (errno != ENOENT) {
    return failureAt(path, errno);
  }
  if (auto written = files.replace(next, bytes, kServedMode); !written)
    return Failure{written.error().description};
  const timespec times[] = {{time, 0}, {time, 0}};
  if (::utimensat(AT_FDCWD, next.c_str(), times, 0) != 0) return failureAt(next, errno);
  if (auto renamed = files.rename(next, path); !renamed) return Failure{renamed.error().description};
  return Done();
}

Result<Done, std::string> ServedFolder::putBack(const std::string& name, const Kept& kept) const {
  const auto numbers = keptNumbers(name);
  if (!numbers) return Failure{numbers.error()};
  if (auto replaced = replace(name, kept.bytes); !replaced) return replaced;
  for (const std::uint64_t number : numbers.value()) {
    if (number >= kept.number) (void)platform::DiskFileStore().unlink(keptPath(name, number));
  }
  return Done();
}

}  // namespace veltrad::storebag
