// A file that a session uploads: what is lent to the daemon, and the right to remove it, which stays here.
#pragma once

#include <sys/stat.h>

#include <optional>
#include <string>

#include "platform/file_descriptor.h"

namespace veltrad {

// Made by the caller of an upload, asked under its connection's lock, settled by the thread that takes the
// answer. Holds the file and its directory open, so that neither another working directory nor a number used
// again can make it remove what it did not lend.
class UploadedFile {
 public:
  // Opens what `path` names without waiting for it; links are not followed, other than regular files not
  // opened.
  explicit UploadedFile(const std::string& path);

  // For people and for the file's name on the server.
  const std::string& absolutePath() const { return _absolutePath; }
  // -1: it could not be opened.
  int descriptor() const { return _file.get(); }
  // One line on why no daemon takes it.
  const std::optional<std::string>& problem() const { return _problem; }

  // The daemon has asked for its removal; only so does remove() make sense.
  void askForRemoval() { _removalAsked = true; }
  bool removalAsked() const { return _removalAsked; }
  // Removes it if its path still names the same regular file. Nothing: done; else one line on why it stays.
  std::optional<std::string> remove() const;

 private:
  void open();
  std::string failed(const char* what, int error) const;

  // Constant after construction.
  std::string _absolutePath;
  std::string _name;  // in its directory
  platform::FileDescriptor _directory;
  platform::FileDescriptor _file;
  struct stat _facts {};
  std::optional<std::string> _problem;

  bool _removalAsked = false;
};

}  // namespace veltrad
