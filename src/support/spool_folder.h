// SPDX-License-Identifier: Apache-2.0
// The files of the spool, one for each post. Any thread; a file is used by one at a time.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "support/spool_entry.h"

namespace veltrad::platform {
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::support {

class SpoolFolder {
 public:
  struct Name {
    std::uint64_t order = 0;
    PostID id{};

    bool operator<(const Name& other) const { return order < other.order; }
  };
  // Without an entry: damaged, or not there, or not to be read at the moment. `bytes`: of the file, also of
  // one that cannot be read at the moment.
  struct Read {
    std::optional<SpoolEntry> entry;
    std::size_t bytes = 0;
    bool torn = false;  // or nobody may read it
    bool passes = false;
  };
  // The result of removeAll().
  struct Removed {
    std::uint64_t posts = 0;
    std::uint64_t events = 0;
    std::uint64_t torn = 0;  // further files, whose posts cannot be read
    bool all = false;        // no file of a post is left
  };

  // The store must outlive it. Nothing is made before make().
  SpoolFolder(platform::FileStore& files, std::string directory)
      : _files(files), _directory(std::move(directory)) {}

  // The directory, mode 0700, also where there was one.
  Result<Done, std::string> make() const;
  // Removes what a killed daemon has left unfinished, and lists the others, oldest first. Files whose time is
  // ahead of `now`, in seconds since 1970, get names as bringBack() says. Absent if it cannot be told at the
  // moment.
  std::optional<std::vector<Name>> names(double now) const;
  // Written new, synced, renamed, and the directory synced. On failure there is one line, and a file may be
  // left, which is whole.
  Result<Done, std::string> write(const Name& name, std::string_view file) const;
  // The order is that of the file's name, whatever the file says.
  Read read(const Name& name) const;
  // False: it is still there.
  bool remove(const Name& name) const;
  // Removes all files and the directory.
  Removed removeAll() const;
  const std::string& directory() const { return _directory; }

 private:
  std::string pathOf(const Name& name) const;
  Read readFile(const Name& name) const;
  void bringNamesBack(std::vector<Name>& names, double now) const;

  platform::FileStore& _files;
  const std::string _directory;
};

}  // namespace veltrad::support
