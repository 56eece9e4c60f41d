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
  // Without an entry: torn, or not there, or not to be read just now.
  struct Read {
    std::optional<SpoolEntry> entry;
    std::size_t bytes = 0;
    bool torn = false;
    bool passes = false;  // it cannot be read just now
  };
  // What was removed at once.
  struct Removed {
    std::uint64_t posts = 0;
    std::uint64_t events = 0;
    std::uint64_t torn = 0;  // further files, whose posts cannot be read
  };

  // The store outlives it. Nothing is made before make().
  SpoolFolder(platform::FileStore& files, std::string directory)
      : _files(files), _directory(std::move(directory)) {}

  // The directory, mode 0700.
  Result<Done, std::string> make() const;
  // Removes what a killed daemon has left unfinished, and lists the others, oldest first.
  std::vector<Name> names() const;
  // Written new, synced, renamed, and the directory synced. On failure nothing is left, and there is one
  // line.
  Result<Done, std::string> write(const Name& name, std::string_view file) const;
  // The same for a file that is there, and stays as it is if that fails.
  bool rewrite(const Name& name, std::string_view file) const;
  Read read(const Name& name) const;
  void remove(const Name& name) const;
  // All of it, and the directory.
  Removed removeAll() const;
  const std::string& directory() const { return _directory; }

 private:
  std::string pathOf(const Name& name) const;

  platform::FileStore& _files;
  const std::string _directory;
};

}  // namespace veltrad::support
