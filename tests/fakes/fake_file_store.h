// SPDX-License-Identifier: Apache-2.0
// Files in memory, on a disk that can fail and fill up. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/file_store.h"

namespace veltrad {

class FakeFileStore final : public platform::FileStore {
 public:
  using Kind = platform::FileFailure::Kind;

  Result<std::string, platform::FileFailure> read(const std::string& path,
                                                  std::size_t most = 16u << 20) override {
    std::lock_guard lock(_mutex);
    if (_short) return Failure{failureOf(path, Kind::shortage)};
    if (const auto failure = _readFailures.find(path); failure != _readFailures.end())
      return Failure{failureOf(path, failure->second)};
    const File* file = find(path);
    if (!file) return Failure{failureOf(path, Kind::notFound)};
    if (file->bytes.size() > most) return Failure{failureOf(path, Kind::tooLarge)};
    return file->bytes;
  }
  Result<Done, platform::FileFailure> replace(const std::string& path, std::string_view bytes,
                                              unsigned mode = 0600) override {
    std::lock_guard lock(_mutex);
    if (_short) return Failure{failureOf(path, Kind::shortage)};
    if (_writeFailure) return Failure{failureOf(path, *_writeFailure)};
    _files[path] = {std::string(bytes), mode, ++_lastStamp};
    ++_replaced;
    return Done();
  }
  Result<Done, platform::FileFailure> rename(const std::string& from, const std::string& to) override {
    std::lock_guard lock(_mutex);
    if (_writeFailure) return Failure{failureOf(from, *_writeFailure)};
    const File* file = find(from);
    if (!file) return Failure{failureOf(from, Kind::notFound)};
    _files[to] = *file;
    _files.erase(from);
    return Done();
  }
  Result<Done, platform::FileFailure> unlink(const std::string& path) override {
    std::lock_guard lock(_mutex);
    if (_writeFailure) return Failure{failureOf(path, *_writeFailure)};
    _files.erase(path);
    return Done();
  }
  Result<platform::FileStamp, platform::FileFailure> stamp(const std::string& path) override {
    std::lock_guard lock(_mutex);
    if (_stampsFail) return Failure{failureOf(path, Kind::shortage)};
    const File* file = find(path);
    return file ? platform::FileStamp(file->stamp) : platform::FileStamp();
  }

  // A change by another process; never fails.
  void put(const std::string& path, std::string_view bytes) {
    std::lock_guard lock(_mutex);
    _files[path] = {std::string(bytes), 0644, ++_lastStamp};
  }
  void remove(const std::string& path) {
    std::lock_guard lock(_mutex);
    _files.erase(path);
  }
  std::optional<std::string> bytes(const std::string& path) const {
    std::lock_guard lock(_mutex);
    const File* file = find(path);
    return file ? std::optional(file->bytes) : std::nullopt;
  }
  unsigned mode(const std::string& path) const {
    std::lock_guard lock(_mutex);
    return find(path) ? find(path)->mode : 0;
  }
  int replaced() const { return _replaced; }

  // Makes writes fail from now on; absent: they succeed again. To be called while no other thread uses it.
  void failWrites(std::optional<Kind> kind) { _writeFailure = kind; }
  void failReads(const std::string& path, std::optional<Kind> kind) {
    _readFailures.erase(path);
    if (kind) _readFailures.emplace(path, *kind);
  }
  // No file at all can be read or written just now.
  void runShort(bool isShort, bool stampsFail = false) {
    _short = isShort;
    _stampsFail = isShort && stampsFail;
  }

 private:
  struct File {
    std::string bytes;
    unsigned mode = 0600;
    std::uint64_t stamp = 0;
  };

  const File* find(const std::string& path) const {
    const auto file = _files.find(path);
    return file == _files.end() ? nullptr : &file->second;
  }
  static platform::FileFailure failureOf(const std::string& path, Kind kind) {
    static const char* const kTexts[] = {
        "No such file or directory", "Permission denied", "larger than was asked for",
        "No space left on device",   "Is a directory",    "Too many open files"};
    return {kind, path + ": " + kTexts[static_cast<int>(kind)]};
  }

  mutable std::mutex _mutex;
  std::map<std::string, File> _files;
  std::map<std::string, Kind> _readFailures;
  std::optional<Kind> _writeFailure;
  bool _short = false;
  bool _stampsFail = false;
  int _replaced = 0;
  std::uint64_t _lastStamp = 0;
};

}  // namespace veltrad
