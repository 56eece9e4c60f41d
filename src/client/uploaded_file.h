// SPDX-License-Identifier: Apache-2.0
// A file that a session uploads: it is lent to the daemon, and removed by the library.
#pragma once

#include <sys/stat.h>

#include <optional>
#include <string>

#include "base/file_descriptor.h"

namespace veltrad::client {

// Constructed by the caller of an upload, marked for removal under its connection's lock, and settled by the
// thread that takes the answer. Keeps the file and its directory open, so that it never removes another file
// if the working directory changes or an inode number is reused. For a file on a network or FUSE file system
// it lends a copy, which it makes at once.
class UploadedFile {
 public:
  // Opens `path` if it is a regular file, without following a link and without blocking.
  explicit UploadedFile(const std::string& path);

  const std::string& absolutePath() const { return _absolutePath; }
  // -1 if it could not be opened.
  int descriptor() const { return _copy.isOpen() ? _copy.get() : _file.get(); }
  // One line that says why the daemon will not take it.
  const std::optional<std::string>& problem() const { return _problem; }

  void askForRemoval() { _removalAsked = true; }
  bool removalAsked() const { return _removalAsked; }
  // Removes the file if its path still names the same regular file; never removes another one, even if files
  // are swapped meanwhile. Returns nothing on success, else one line that says why it stays or where it is
  // now.
  std::optional<std::string> remove() const;

 private:
  void open();
  void copyIfServedByOthers();
  bool isSame(const struct stat& other) const;
  std::string putBack(const std::string& aside) const;
  std::string failed(const std::string& what, int error) const;

  // Constant after construction.
  std::string _absolutePath;
  // Within its directory.
  std::string _name;
  FileDescriptor _directory;
  FileDescriptor _file;
  FileDescriptor _copy;
  struct stat _facts {};
  std::optional<std::string> _problem;

  bool _removalAsked = false;
};

}  // namespace veltrad::client
