// A file that a session uploads: what is lent to the daemon, and the right to remove it, which stays here.
#pragma once

#include <sys/stat.h>

#include <optional>
#include <string>

#include "base/file_descriptor.h"

namespace veltrad::client {

// Made by the caller of an upload, asked under its connection's lock, settled by the thread that takes the
// answer. Holds the file and its directory open, so that neither another working directory nor a number used
// again can make it remove what it did not lend. Of a file that others serve (FUSE, a network) it lends a
// copy, made at once: the daemon waits for nobody's server.
class UploadedFile {
 public:
  // Opens what `path` names without waiting for it; links are not followed, other than regular files not
  // opened.
  explicit UploadedFile(const std::string& path);

  // For people and for the file's name on the server.
  const std::string& absolutePath() const { return _absolutePath; }
  // -1: it could not be opened.
  int descriptor() const { return _copy.isOpen() ? _copy.get() : _file.get(); }
  // One line on why no daemon takes it.
  const std::optional<std::string>& problem() const { return _problem; }

  // The daemon has asked for its removal; only so does remove() make sense.
  void askForRemoval() { _removalAsked = true; }
  bool removalAsked() const { return _removalAsked; }
  // Removes it if its path still names the same regular file; another one is never removed, whoever swaps
  // files meanwhile. Nothing: done; else one line on why it stays, or where it is now.
  std::optional<std::string> remove() const;

 private:
  void open();
  void copyIfServedByOthers();
  bool isSame(const struct stat& other) const;
  std::string putBack(const std::string& aside) const;
  std::string failed(const std::string& what, int error) const;

  // Constant after construction.
  std::string _absolutePath;
  std::string _name;  // in its directory
  FileDescriptor _directory;
  FileDescriptor _file;
  FileDescriptor _copy;
  struct stat _facts {};
  std::optional<std::string> _problem;

  bool _removalAsked = false;
};

}  // namespace veltrad::client
