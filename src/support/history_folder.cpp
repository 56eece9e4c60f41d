// SPDX-License-Identifier: Apache-2.0
// Writes the files of the history.
#include "support/history_folder.h"

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <new>
#include <numeric>

#include "platform/file_store.h"
#include "platform/log.h"
#include "support/history_file.h"

namespace veltrad::support {

namespace {

constexpr std::string_view kDaySuffix = ".history";
constexpr std::int64_t kSecondsOfDay = 86'400;
constexpr std::size_t kCopyPiece = 256u << 10;
// Written in one call, if bodies are small.
constexpr std::size_t kMostInOneWrite = 1u << 20;

std::string errorText(int error) {
  return std::strerror(error);
}

void syncDirectory(const std::string& path) {
  const FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (directory.isOpen()) ::fsync(directory.get());
}

// Calls `take` for the pieces of a part of a file. False if that fails, or the file ends before.
template <typename Take>
bool eachPiece(int file, std::uint64_t offset, std::uint64_t bytes, const Take& take) {
  std::string piece(std::min<std::uint64_t>(kCopyPiece, bytes), '\0');
  while (bytes > 0) {
    const ssize_t got =
        ::pread(file, piece.data(), std::min<std::uint64_t>(piece.size(), bytes), static_cast<off_t>(offset));
    if (got < 0 && errno == EINTR) continue;
    if (got == 0) errno = EIO;
    if (got <= 0 || !take(std::string_view(piece.data(), static_cast<std::size_t>(got)))) return false;
    offset += static_cast<std::uint64_t>(got);
    bytes -= static_cast<std::uint64_t>(got);
  }
  return true;
}

// Collects bytes so that they are written in few calls.
class Appending {
 public:
  explicit Appending(int file) : _file(file) {}
  bool write(std::string_view bytes) {
    if (_bytes.size() + bytes.size() > kMostInOneWrite && !flush()) return false;
    if (bytes.size() <= kMostInOneWrite) {
      _bytes.append(bytes);
      return true;
    }
    errno = writeAll(_file, bytes);
    return errno == 0;
  }
  bool flush() {
    errno = writeAll(_file, _bytes);
    _bytes.clear();
    return errno == 0;
  }
  bool write(const HistoryRecord& record) {
    std::uint32_t crc = 0;
    const auto put = [&](std::string_view bytes) {
      crc = historyCRC(crc, bytes);
      return write(bytes);
    };
    const std::uint64_t body = record.file ? record.bodyBytes : record.body.size();
    return put(historyLengths(record.header.size(), body)) && put(record.header) && put(record.body) &&
           (!record.file || eachPiece(record.file->get(), 0, record.bodyBytes, put)) &&
           write(historyChecksum(crc));
  }

 private:
  const int _file;
  std::string _bytes;
};

// Returns an errno, 0 if all of it is on disk.
int writeAndSync(int file, HistoryRecords::const_iterator first, HistoryRecords::const_iterator last) {
  try {
    Appending appending(file);
    const bool written =
        std::all_of(first, last, [&](const auto& record) { return appending.write(record); }) &&
        appending.flush() && ::fdatasync(file) == 0;
    return written ? 0 : errno;
  } catch (const std::bad_alloc&) {
    return ENOMEM;
  }
}

}  // namespace

std::string HistoryFolder::nameOf(std::int64_t day) {
  const std::time_t seconds = day * kSecondsOfDay;
  std::tm parts{};
  gmtime_r(&seconds, &parts);
  std::array<char, 32> text{};
  return {text.data(), std::strftime(text.data(), text.size(), "%Y-%m-%d", &parts)};
}

std::optional<std::int64_t> HistoryFolder::dayNamed(std::string_view name) {
  std::tm parts{};
  const std::string text(name);
  const char* end = ::strptime(text.c_str(), "%Y-%m-%d", &parts);
  if (end == nullptr || *end != '\0') return std::nullopt;
  const std::int64_t day = ::timegm(&parts) / kSecondsOfDay;
  return nameOf(day) == name ? std::optional(day) : std::nullopt;
}

std::string HistoryFolder::pathOf(const std::string& directory, std::int64_t day) {
  return directory + "/" + nameOf(day) + std::string(kDaySuffix);
}

std::map<std::int64_t, std::uint64_t> HistoryFolder::days(const std::string& directory) {
  std::map<std::int64_t, std::uint64_t> found;
  const std::unique_ptr<DIR, int (*)(DIR*)> opened(::opendir(directory.c_str()), ::closedir);
  while (const dirent* entry = opened ? ::readdir(opened.get()) : nullptr) {
    std::string_view name = entry->d_name;
    if (!name.ends_with(kDaySuffix)) continue;
    name.remove_suffix(kDaySuffix.size());
    const auto day = dayNamed(name);
    struct stat status {};
    if (day && ::fstatat(::dirfd(opened.get()), entry->d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode))
      found.emplace(*day, static_cast<std::uint64_t>(status.st_size));
  }
  return found;
}

std::uint64_t HistoryFolder::mend() {
  std::uint64_t cut = 0;
  const auto all = days(_directory);
  // Two, because a batch at midnight writes to both.
  int left = 2;
  for (auto at = all.rbegin(); at != all.rend() && left > 0; ++at, --left) {
    const std::string path = pathOf(_directory, at->first);
    const HistoryFile file(path);
    const std::uint64_t end = file.intactEnd();
    if (end < file.size() && ::truncate(path.c_str(), static_cast<off_t>(end)) == 0) cut += file.size() - end;
  }
  return cut;
}

void HistoryFolder::append(HistoryRecords& records, std::string& error) {
  while (!records.empty()) {
    const std::int64_t day = records.front().day;
    const auto last =
        std::find_if(records.begin(), records.end(), [day](const auto& one) { return one.day != day; });
    if (auto written = appendTo(day, records.begin(), last); !written) {
      error = std::move(written.error());
      return;
    }
    records.erase(records.begin(), last);
  }
}

Result<Done, std::string> HistoryFolder::appendTo(std::int64_t day, HistoryRecords::const_iterator first,
                                                  HistoryRecords::const_iterator last) {
  if (const auto made = platform::makeDirectories(_directory, 0700); !made)
    return Failure{made.error().description};
  const std::string path = pathOf(_directory, day);
  const int flags = O_WRONLY | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC;
  const FileDescriptor file(::open(path.c_str(), flags, 0600));
  struct stat before {};
  if (!file.isOpen() || ::fstat(file.get(), &before) != 0) return Failure{path + ": " + errorText(errno)};
  const int error = writeAndSync(file.get(), first, last);
  if (error != 0) {
    const bool shortened = ::ftruncate(file.get(), before.st_size) == 0;
    std::string why = path + ": " + errorText(error);
    if (!shortened) why += ", nor shortened: " + errorText(errno);
    return Failure{std::move(why)};
  }
  if (before.st_size == 0) syncDirectory(_directory);
  return Done();
}

void HistoryFolder::trim(const HistorySpace& space, std::int64_t today) {
  auto all = days(_directory);
  while (!all.empty() && all.begin()->first <= today - space.days) {
    remove(all.begin()->first);
    all.erase(all.begin());
  }
  std::uint64_t bytes = std::accumulate(all.begin(), all.end(), std::uint64_t{0},
                                        [](std::uint64_t sum, const auto& day) { return sum + day.second; });
  // A shortened file is rewritten, so more is removed than necessary.
  const std::uint64_t target = space.bytes - space.bytes / 8;
  const bool tooMuch = bytes > space.bytes;
  for (auto at = all.begin(); tooMuch && at != all.end() && bytes > target; ++at) {
    if (at->second <= bytes - target && std::next(at) != all.end()) {
      remove(at->first);
      bytes -= at->second;
    } else {
      shorten(at->first, bytes - target);
      return;
    }
  }
}

// Removes the oldest records, of at least so many bytes.
void HistoryFolder::shorten(std::int64_t day, std::uint64_t bytes) {
  const std::string path = pathOf(_directory, day);
  const HistoryFile file(path);
  std::uint64_t keep = 0;
  for (auto place = file.at(0); place && keep < bytes; place = file.at(place->end())) keep = place->end();
  const std::string fresh = path + ".00000000.new";  // a name that a start removes
  ::unlink(fresh.c_str());
  const FileDescriptor copy(
      ::open(fresh.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  const bool copied = copy.isOpen() &&
                      eachPiece(file.descriptor(), keep, file.size() - keep,
                                [&](std::string_view piece) {
                                  errno = writeAll(copy.get(), piece);
                                  return errno == 0;
                                }) &&
                      ::fsync(copy.get()) == 0 && ::rename(fresh.c_str(), path.c_str()) == 0;
  if (copied) return syncDirectory(_directory);
  logError("The history could not be shortened, and its oldest day goes: %s: %s", path.c_str(),
           errorText(errno).c_str());
  ::unlink(fresh.c_str());
  remove(day);
}

void HistoryFolder::remove(std::int64_t day) {
  ::unlink(pathOf(_directory, day).c_str());
  syncDirectory(_directory);
}

HistoryFolder::Removed HistoryFolder::purge() {
  Removed removed;
  for (const auto& [day, bytes] : days(_directory)) {
    const HistoryFile file(pathOf(_directory, day));
    for (auto place = file.at(0); place; place = file.at(place->end())) {
      const auto header = file.header(*place);
      if (header && header->contains("id")) ++removed.records;
    }
    removed.bytes += bytes;
    ++removed.days;
    remove(day);
  }
  return removed;
}

}  // namespace veltrad::support
