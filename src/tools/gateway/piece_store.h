// SPDX-License-Identifier: Apache-2.0
// The folder of files: incomplete bodies in pieces below "incoming", and whole files in a folder for each
// day.
#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <string_view>

#include "base/result.h"
#include "gateway/store_error.h"

namespace veltrad::gateway {

// Writing the same piece again changes nothing, so a batch may be repeated. The errors are one line and name
// the file. Used by one thread.
class PieceStore {
 public:
  explicit PieceStore(std::string folder) : _folder(std::move(folder)) {}

  // Makes the folder.
  Result<Done, StoreError> open();
  // Removes pieces that are a day older than the message that has just been read, in nanoseconds since 1970:
  // the last piece of their bodies never came.
  void forgetUnfinished(std::int64_t read);
  // Removes the whole files of earlier days ("2026-11-26").
  void forgetDaysBefore(std::string_view day);
  // `place` is "TOKEN OFFSET", `time` that of the message in nanoseconds since 1970.
  Result<Done, StoreError> write(std::string_view place, std::string_view bytes, std::int64_t time);
  // The whole body of which `last` is the last piece.
  Result<std::string, StoreError> wholeOf(std::string_view place, std::string_view last);
  // Makes a file of the whole body: the same as DAY/NAME below the folder, which is returned; the day is that
  // of the message's time. Without a place `last` is all of it.
  Result<std::string, StoreError> keep(std::string_view place, std::string_view last, const std::string& name,
                                       std::int64_t time);
  // Syncs everything that was written to the disk.
  Result<Done, StoreError> sync();
  // After the commit of what the pieces have become.
  void forget(std::string_view place);

 private:
  // Whether there is such a file; a shortage is an error.
  static Result<bool, StoreError> exists(const std::string& path);
  std::string incoming(std::string_view token) const { return _folder + "/incoming/" + std::string(token); }

  const std::string _folder;
  // Files and folders that were written since the last sync.
  std::set<std::string> _unsynced;
};

}  // namespace veltrad::gateway
