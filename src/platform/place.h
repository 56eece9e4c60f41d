// SPDX-License-Identifier: Apache-2.0
// Opens a file's directory safely, also for root in a directory of another user. Any thread.
#pragma once

#include <optional>
#include <string>
#include <utility>

#include "base/file_descriptor.h"
#include "base/result.h"

namespace veltrad::platform {

// The owner of written files. inherited: for root in a directory of the daemon's user. A written file gets
// the owner and mode of the file that it replaces, a new file the owner of its directory, so that the daemon
// can use it. A symbolic link is an error (ELOOP), except where root or this process's user alone can have
// made it, so that the daemon's user cannot lead root to other files.
enum class Ownership { own, inherited };

// The path up to its last slash.
std::string directoryOf(const std::string& path);

// The first argument of openat() and its like, and the second: a name in a directory that stays open, or a
// path.
class Place {
 public:
  // Errors are those of errno.
  static Result<Place, int> of(const std::string& path, Ownership ownership);

  int directory() const;
  const char* name() const { return _name.c_str(); }
  // O_NOFOLLOW, or nothing: for openat().
  int links() const;
  // Ownership::inherited: gives an open file to the owner of the directory. 0, or errno.
  int giveToOwner(int file) const;

 private:
  Place(FileDescriptor directory, std::string name)
      : _directory(std::move(directory)), _name(std::move(name)) {}

  FileDescriptor _directory;  // open with Ownership::inherited
  std::string _name;
};

// Opens a directory, as Ownership::inherited says, for the calls that take a directory and a name; it cannot
// be read (O_PATH). What is missing is made with `mode`, if there is one. Errors are those of errno.
Result<FileDescriptor, int> openDirectory(const std::string& path, std::optional<unsigned> mode = {});

}  // namespace veltrad::platform
