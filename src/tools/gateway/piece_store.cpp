// SPDX-License-Identifier: Apache-2.0
// Writes pieces at their places.
#include "gateway/piece_store.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstring>
#include <filesystem>
#include <optional>

#include "base/file_descriptor.h"
#include "gateway/table_rows.h"

namespace veltrad::gateway {

namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kMostBody = std::uint64_t{1} << 40;
constexpr std::uint64_t kMostInMemory = 512u << 20;
// Seconds.
constexpr std::int64_t kForgottenAfter = 86'400;
constexpr std::int64_t kPerSecond = 1'000'000'000;  // nanoseconds
constexpr std::size_t kDayLength = 10;

struct PiecePlace {
  std::string token;
  std::uint64_t offset = 0;
};

// A token is a file's name, so nothing but hexadecimal digits is taken.
std::optional<PiecePlace> placeIn(std::string_view text) {
  const std::size_t blank = text.find(' ');
  PiecePlace place{std::string(text.substr(0, blank)), 0};
  if (blank == std::string_view::npos || place.token.empty() || place.token.size() > 64 ||
      place.token.find_first_not_of("0123456789abcdef") != std::string::npos)
    return std::nullopt;
  const auto read = std::from_chars(text.data() + blank + 1, text.data() + text.size(), place.offset);
  if (read.ec != std::errc() || read.ptr != text.data() + text.size() || place.offset > kMostBody)
    return std::nullopt;
  return place;
}

// As far as the folder can be read.
template <typename Visit>
void eachIn(const fs::path& folder, const Visit& visit) {
  std::error_code error;
  for (fs::directory_iterator entry(folder, error), end; !error && entry != end; entry.increment(error))
    visit(entry->path());
}

Failure<StoreError> failureOfFile(const std::string& path) {
  return passingFailure(path + ": " + std::strerror(errno));
}

}  // namespace

Result<Done, StoreError> PieceStore::open() {
  std::error_code error;
  const fs::path below = fs::path(_folder) / "incoming";
  fs::create_directories(below, error);
  if (error) return passingFailure(below.string() + ": " + error.message());
  return Done();
}

void PieceStore::forgetUnfinished(std::int64_t read) {
  eachIn(fs::path(_folder) / "incoming", [read](const fs::path& path) {
    struct stat found {};
    if (::stat(path.c_str(), &found) == 0 && found.st_mtim.tv_sec < read / kPerSecond - kForgottenAfter)
      ::unlink(path.c_str());
  });
}

void PieceStore::forgetDaysBefore(std::string_view day) {
  eachIn(_folder, [day](const fs::path& path) {
    const std::string name = path.filename().string();
    std::error_code ignored;
    if (name.size() == kDayLength && name.find_first_not_of("0123456789-") == std::string::npos && name < day)
      fs::remove_all(path, ignored);
  });
}

Result<Done, StoreError> PieceStore::write(std::string_view place, std::string_view bytes,
                                           std::int64_t time) {
  const auto where = placeIn(place);
  if (!where) return dataFailure(fmt::format("a piece without a place: \"{}\"", place));
  const std::string path = incoming(where->token);
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0640));
  if (!file.isOpen()) return failureOfFile(path);
  _unsynced.insert({path, _folder + "/incoming"});
  std::uint64_t at = where->offset;
  while (!bytes.empty()) {
    const ssize_t count = ::pwrite(file.get(), bytes.data(), bytes.size(), static_cast<off_t>(at));
    if (count < 0 && errno != EINTR) return failureOfFile(path);
    if (count < 0) continue;
    at += static_cast<std::uint64_t>(count);
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  const timespec times[] = {{0, UTIME_OMIT}, {time / kPerSecond, time % kPerSecond}};
  if (::futimens(file.get(), times) != 0) return failureOfFile(path);
  return Done();
}

Result<std::string, StoreError> PieceStore::wholeOf(std::string_view place, std::string_view last) {
  if (place.empty()) return std::string(last);
  const auto where = placeIn(place);
  if (!where || where->offset > kMostInMemory)
    return dataFailure(fmt::format("a body without a place: \"{}\"", place));
  const std::string path = incoming(where->token);
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
  if (!file.isOpen() && errno == ENOENT) return dataFailure(path + ": its pieces are missing");
  if (!file.isOpen()) return failureOfFile(path);
  std::string body(where->offset, '\0');
  for (std::size_t at = 0; at < body.size();) {
    const ssize_t count = ::pread(file.get(), &body[at], body.size() - at, static_cast<off_t>(at));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return failureOfFile(path);
    if (count == 0) return dataFailure(path + ": pieces are missing");
    at += static_cast<std::size_t>(count);
  }
  return body.append(last);
}

Result<bool, StoreError> PieceStore::exists(const std::string& path) {
  struct stat found {};
  if (::stat(path.c_str(), &found) == 0) return true;
  if (errno == ENOENT) return false;
  return failureOfFile(path);
}

Result<std::string, StoreError> PieceStore::keep(std::string_view place, std::string_view last,
                                                 const std::string& name, std::int64_t time) {
  const std::string day = dayText(time);
  const std::string kept = day + "/" + name;
  const std::string path = _folder + "/" + kept;
  std::error_code error;
  fs::create_directories(_folder + "/" + day, error);
  if (error) return passingFailure(path + ": " + error.message());
  _unsynced.insert({_folder, _folder + "/" + day});
  // A batch that is repeated finds the file that it has made.
  const auto made = exists(path);
  if (!made) return Failure{made.error()};
  if (made.value()) return kept;
  const std::string whole = place.empty() ? name + " 0" : std::string(place);
  const auto where = placeIn(whole);
  if (!where) return dataFailure(fmt::format("a file without a place: \"{}\"", whole));
  const std::string from = incoming(where->token);
  const auto begun = exists(from);
  if (!begun) return Failure{begun.error()};
  if (!place.empty() && !begun.value()) return dataFailure(path + ": its pieces are missing");
  if (auto written = write(whole, last, time); !written) return Failure{written.error()};
  const FileDescriptor file(::open(from.c_str(), O_WRONLY | O_CLOEXEC));
  if (::fsync(file.get()) != 0 || ::rename(from.c_str(), path.c_str()) != 0) return failureOfFile(from);
  _unsynced.erase(from);
  return kept;
}

Result<Done, StoreError> PieceStore::sync() {
  for (const std::string& path : _unsynced) {
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (!file.isOpen() && errno == ENOENT) continue;
    if (!file.isOpen() || ::fsync(file.get()) != 0) return failureOfFile(path);
  }
  _unsynced.clear();
  return Done();
}

void PieceStore::forget(std::string_view place) {
  if (const auto where = placeIn(place)) ::unlink(incoming(where->token).c_str());
}

}  // namespace veltrad::gateway
