// The current log file, held open while its directory stays as it was listed. Guarded by its owner.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"

namespace veltrad::support {

// What tells whether names came to or went from a directory since it was looked at.
struct DirectoryState {
  std::uint64_t device = 0, inode = 0;
  std::int64_t changedSeconds = 0, changedNanoseconds = 0;
  // The directory last changed so long before the look that a later change has another time.
  bool settled = false;

  // Nothing when it cannot be looked at.
  static std::optional<DirectoryState> of(const std::string& directory);
  bool sameAs(const DirectoryState& later) const;
};

// Listing a directory, looking at its files, opening and closing cost five times the write itself. A plain
// value; closes with it.
class OpenLogFile {
 public:
  // Opens for appending, following no link and waiting for nothing. `listed`: the directory's state before
  // the listing that found `path`. False with nothing open.
  bool open(std::string path, std::optional<DirectoryState> listed);
  void close() { _file.reset(); }
  // Still the file that a listing of `directory` would find.
  bool isCurrent(const std::string& directory) const;
  // Of the open file; see creationDate().
  std::optional<double> created() const;
  const std::string& path() const { return _path; }
  // One write at the end. False when less than all of it was written.
  bool append(const std::string& line) const;

 private:
  FileDescriptor _file;
  std::string _path;
  std::optional<DirectoryState> _listed;
};

// Of the birth time and the modification time the earlier, in seconds since 1970; without a birth time the
// seconds in a log file's own name. `file`: an open file, or AT_FDCWD for what stands at `path`, links not
// followed.
std::optional<double> creationDate(int file, const std::string& path);

// The part between the underscores of a name that is one of the daemon's log files.
std::optional<std::string_view> secondsInLogFileName(std::string_view name);

}  // namespace veltrad::support
