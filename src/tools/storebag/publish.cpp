// SPDX-License-Identifier: Apache-2.0
// Checks storebags and moves them into the folder that is served.
#include "storebag/publish.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <set>

#include "base/file_descriptor.h"
#include "config/storebag_container.h"
#include "platform/file_store.h"
#include "storebag/lint.h"

namespace veltrad::storebag {

namespace {

namespace fs = std::filesystem;

constexpr unsigned kServedMode = 0644;
// Of each name.
constexpr std::size_t kMostKept = 10;

// One storebag that is about to be published.
struct Publication {
  std::string name;
  std::string bytes;
};

std::optional<std::int64_t> serialOf(const Dictionary& storebag) {
  const Value* serial = storebag.find("serial");
  return serial ? serial->toInt64() : std::nullopt;
}

// The numbers under which storebags of the name are kept, the newest last.
std::vector<std::uint64_t> keptNumbers(const fs::path& folder) {
  std::vector<std::uint64_t> numbers;
  std::error_code error;
  for (const auto& entry : fs::directory_iterator(folder, error)) {
    const std::string text = entry.path().filename().string();
    if (!text.empty() && text.size() < 19 && text.find_first_not_of("0123456789") == std::string::npos)
      numbers.push_back(std::stoull(text));
  }
  std::sort(numbers.begin(), numbers.end());
  return numbers;
}

fs::path folderBefore(const std::string& directory, const std::string& name) {
  return fs::path(directory) / ".before" / name;
}

// "Last-Modified" has whole seconds, so of two within one second a daemon would miss the second.
std::optional<std::string> makeNewer(const std::string& path, std::time_t than) {
  const std::time_t time = std::max(std::time(nullptr), than + 1);
  const timespec times[] = {{time, 0}, {time, 0}};
  if (::utimensat(AT_FDCWD, path.c_str(), times, 0) == 0) return std::nullopt;
  return path + ": " + std::strerror(errno);
}

std::time_t modified(const std::string& path) {
  struct stat found {};
  return ::stat(path.c_str(), &found) == 0 ? found.st_mtime : 0;
}

Result<Publication, std::string> checked(const std::string& file, const PublishRequest& request) {
  const Outcome verified = verify(request.publicKey, file);
  if (!verified.done) return Failure{verified.text};
  const auto bag = readStorebag(file);
  if (!bag) return Failure{bag.error().line()};
  if (std::string errors = errorsIn(bag.value()); !errors.empty()) return Failure{std::move(errors)};
  Publication made{fs::path(file).filename().string(), bag.value().document.bytes};
  if (made.name.starts_with('.') || made.name.empty())
    return Failure{file + ": the file's name is to be the storebag's"};
  const std::string* name = bag.value().storebag.string("name");
  if (name && *name != made.name)
    return Failure{
        fmt::format("{}: the storebag's name is \"{}\", the file's is \"{}\"", file, *name, made.name)};
  const std::string path = request.directory + "/" + made.name;
  std::error_code error;
  if (!fs::exists(path, error) && !error) return made;
  // One that cannot be read now may have a higher serial.
  const auto served = readStorebag(path);
  if (!served) return Failure{served.error().line()};
  const auto before = serialOf(served.value().storebag);
  if (const std::string fault = faultOfSerial(before, serialOf(bag.value().storebag)); !fault.empty())
    return Failure{file + ": " + fault};
  return made;
}

// The file that is served is kept, then replaced.
std::optional<std::string> put(const Publication& made, const std::string& directory) {
  platform::DiskFileStore files;
  const std::string path = directory + "/" + made.name;
  const fs::path kept = folderBefore(directory, made.name);
  const std::time_t before = modified(path);
  if (const auto served = files.read(path, config::kStorebagMostContainerBytes); served) {
    // What is published again would take the place of what a rollback is for.
    if (served.value() == made.bytes) return std::nullopt;
    const auto numbers = keptNumbers(kept);
    if (auto folder = platform::makeDirectories(kept.string()); !folder) return folder.error().description;
    const std::string next = (kept / std::to_string(numbers.empty() ? 1 : numbers.back() + 1)).string();
    if (auto copied = files.replace(next, served.value(), kServedMode); !copied)
      return copied.error().description;
    for (std::size_t at = 0; at + kMostKept <= numbers.size(); ++at)
      (void)files.unlink((kept / std::to_string(numbers[at])).string());
  }
  if (auto replaced = files.replace(path, made.bytes, kServedMode); !replaced)
    return replaced.error().description;
  return makeNewer(path, before);
}

// Whoever publishes meanwhile waits; until the descriptor is closed.
Result<FileDescriptor, std::string> lockOf(const std::string& directory) {
  FileDescriptor folder(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!folder.isOpen() || ::flock(folder.get(), LOCK_EX) != 0)
    return Failure{directory + ": " + std::strerror(errno)};
  return Result<FileDescriptor, std::string>(std::move(folder));
}

}  // namespace

std::string faultOfSerial(std::optional<std::int64_t> served, std::optional<std::int64_t> next) {
  if (!served) return "";
  if (!next) return fmt::format("it has no serial, the one that is served has {}", *served);
  if (*next < *served) return fmt::format("serial {} is lower than {}, which is served", *next, *served);
  return "";
}

Outcome publish(const PublishRequest& request) {
  if (auto made = platform::makeDirectories(request.directory); !made)
    return {false, made.error().description};
  const auto lock = lockOf(request.directory);
  if (!lock) return {false, lock.error()};
  std::vector<Publication> all;
  for (const std::string& file : request.files) {
    auto one = checked(file, request);
    if (!one) return {false, one.error()};
    all.push_back(std::move(one).value());
  }
  std::string text;
  for (const Publication& one : all) {
    if (const auto failure = put(one, request.directory)) return {false, *failure};
    text += request.directory + "/" + one.name + "\n";
  }
  return {true, std::move(text)};
}

Outcome rollback(const std::vector<std::string>& names, const std::string& directory) {
  platform::DiskFileStore files;
  const auto lock = lockOf(directory);
  if (!lock) return {false, lock.error()};
  std::set<std::string> once;
  for (const std::string& name : names) {
    if (name.empty() || name.starts_with('.') || name.find('/') != std::string::npos)
      return {false, fmt::format("{}: expected the name of a storebag", name)};
    if (!once.insert(name).second) return {false, fmt::format("{}: the name is given twice", name)};
    if (keptNumbers(folderBefore(directory, name)).empty())
      return {false, fmt::format("{}: nothing was published before {}", directory, name)};
  }
  std::string text;
  for (const std::string& name : names) {
    const std::string path = directory + "/" + name;
    const fs::path folder = folderBefore(directory, name);
    const std::string newest = (folder / std::to_string(keptNumbers(folder).back())).string();
    const std::time_t served = modified(path);
    const auto bytes = files.read(newest, config::kStorebagMostContainerBytes);
    if (!bytes) return {false, bytes.error().description};
    if (auto replaced = files.replace(path, bytes.value(), kServedMode); !replaced)
      return {false, replaced.error().description};
    if (const auto failure = makeNewer(path, served)) return {false, *failure};
    (void)files.unlink(newest);
    text += path + "\n";
  }
  return {true, std::move(text)};
}

}  // namespace veltrad::storebag
