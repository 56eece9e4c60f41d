// SPDX-License-Identifier: Apache-2.0
// A settings file under etc/veltrad, as JSON with comments or as a property list. Its owner locks.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/value.h"
#include "platform/file_store.h"

namespace veltrad::platform {

// The content of such a file when it was last read. Immutable.
struct LocalContent {
  enum class Kind { absent, good, broken };
  Kind kind = Kind::absent;
  Value value = false;  // of one that is good
  std::string path;     // of the form that counts
  std::string bytes;
  std::string error;  // of one that is broken: "PATH:LINE:COLUMN: text", or "PATH: text" when
                      // it cannot be read
  std::optional<std::string> warning;  // both forms are there

  // "PATH:LINE:COLUMN" of a key, or of an element of an array by its number from 0; the path alone in a
  // binary property list, whose values have no places. An empty `keys` is the outermost value.
  std::string placeOf(const std::vector<std::string>& keys) const;
};

// NAME.json and NAME.plist are two forms of the same file; if both exist, the JSON is used. JSON has
// comments, {"$date": seconds since 1970} and {"$data": "base64"}.
class LocalSettings {
 public:
  // `path`: of either form. The store must outlive it.
  LocalSettings(FileStore& files, const std::string& path);

  // The current content: the same object until the file changes, so that the owner handles it, and logs its
  // error and warning, once. Reads the file only after a change; otherwise it makes two system calls. A
  // failure is a shortage, and the file is read at the next call, as it is if std::bad_alloc is thrown.
  Result<std::shared_ptr<const LocalContent>, FileFailure> content();
  // The next content() reads, whether a file has changed or not.
  void readAgain() { _stamps.reset(); }

 private:
  Result<LocalContent, FileFailure> read();

  FileStore& _files;
  const std::string _jsonPath;
  const std::string _listPath;
  std::optional<std::pair<FileStamp, FileStamp>> _stamps;  // of the last reading
  std::shared_ptr<const LocalContent> _content;            // null before the first
};

}  // namespace veltrad::platform
