// SPDX-License-Identifier: Apache-2.0
// Appends to, repairs and removes the files of the history, one for each day. One thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <list>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"

namespace veltrad::support {

// To be written. Its body is in `body` or, with `bodyBytes`, in `file`.
struct HistoryRecord {
  std::int64_t day = 0;  // since 1970, UTC
  std::string header;    // JSON
  std::string body;
  std::shared_ptr<const FileDescriptor> file;
  std::uint64_t bodyBytes = 0;
  // The body is too large to be kept: the writer puts its digest into the header instead.
  bool digestAlone = false;

  std::size_t waitingBytes() const { return sizeof *this + header.size() + body.size(); }
};

// A list, so that putting those back that could not be written needs no memory.
using HistoryRecords = std::list<HistoryRecord>;

// The space that the owner of the device allows.
struct HistorySpace {
  std::int64_t days = 0;
  std::uint64_t bytes = 0;
};

class HistoryFolder {
 public:
  struct Removed {
    std::uint64_t records = 0;
    std::uint64_t bytes = 0;
    std::uint64_t days = 0;
  };

  explicit HistoryFolder(std::string directory) : _directory(std::move(directory)) {}

  // Days that have a file, with its size.
  static std::map<std::int64_t, std::uint64_t> days(const std::string& directory);
  static std::string pathOf(const std::string& directory, std::int64_t day);
  // "2026-11-26"; nothing: it is no day.
  static std::string nameOf(std::int64_t day);
  static std::optional<std::int64_t> dayNamed(std::string_view name);

  // Cuts off what a killed daemon has left unfinished. Returns how many bytes that were.
  std::uint64_t mend();
  // Appends the records in order, syncs, and removes from the list those that are completely on disk; nothing
  // of the others is written. The error is that of the first record that failed.
  void append(HistoryRecords& records, std::string& error);
  // Removes the oldest records, until the rest is within the space.
  void trim(const HistorySpace& space, std::int64_t today);
  Removed purge();

 private:
  Result<Done, std::string> appendTo(std::int64_t day, HistoryRecords::const_iterator first,
                                     HistoryRecords::const_iterator last);
  void shorten(std::int64_t day, std::uint64_t bytes);
  void remove(std::int64_t day);

  const std::string _directory;
};

}  // namespace veltrad::support
