// SPDX-License-Identifier: Apache-2.0
// The folder of files: what has come of bodies in pieces, below "incoming", and whole files, in a folder for
// each day.
#pragma once

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

  // Makes the folder and removes pieces of bodies that were never completed, after a day.
  Result<Done, StoreError> open();
  // `place` is "TOKEN OFFSET".
  Result<Done, StoreError> write(std::string_view place, std::string_view bytes);
  // The whole body of which `last` is the last piece.
  Result<std::string, StoreError> wholeOf(std::string_view place, std::string_view last);
  // Makes a file of the whole body: the same as DAY/NAME below the folder, which is returned. Without a place
  // `last` is all of it.
  Result<std::string, StoreError> keep(std::string_view place, std::string_view last, const std::string& day,
                                       const std::string& name);
  // What was written is on the disk when it returns.
  Result<Done, StoreError> sync();
  // After the commit of what the pieces have become.
  void forget(std::string_view place);

 private:
  std::string incoming(std::string_view token) const { return _folder + "/incoming/" + std::string(token); }

  const std::string _folder;
  // Files and folders that were written since the last sync.
  std::set<std::string> _unsynced;
};

}  // namespace veltrad::gateway
