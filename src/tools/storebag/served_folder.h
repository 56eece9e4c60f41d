// SPDX-License-Identifier: Apache-2.0
// The folder from which a web server serves storebags: one file for each name, and below ".before" those that
// were served before.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/file_descriptor.h"
#include "base/result.h"

namespace veltrad::storebag {

// One process at a time has the folder, from open() until the object is gone. Errors are one line that names
// the file.
class ServedFolder {
 public:
  // A storebag that was served before.
  struct Kept {
    std::uint64_t number = 0;
    std::string bytes;
  };

  // Waits until no other process has it. Fails if nothing was ever published there, unless `make`.
  static Result<ServedFolder, std::string> open(const std::string& directory, bool make);

  std::string pathOf(const std::string& name) const { return _directory + "/" + name; }
  // Absent if nothing is served under the name.
  Result<std::optional<std::string>, std::string> served(const std::string& name) const;
  // The newest kept storebag that differs from the served one; absent if there is none.
  Result<std::optional<Kept>, std::string> before(const std::string& name) const;

  // Keeps the served storebag and replaces it by these bytes. Does nothing if they are served already.
  Result<Done, std::string> put(const std::string& name, const std::string& bytes) const;
  // Serves the result of before() again, and removes it and all later ones from those kept.
  Result<Done, std::string> putBack(const std::string& name, const Kept& kept) const;

 private:
  ServedFolder(std::string directory, FileDescriptor lock)
      : _directory(std::move(directory)), _lock(std::move(lock)) {}

  std::string keptPath(const std::string& name) const { return _directory + "/.before/" + name; }
  std::string keptPath(const std::string& name, std::uint64_t number) const {
    return keptPath(name) + "/" + std::to_string(number);
  }
  // The newest last.
  Result<std::vector<std::uint64_t>, std::string> keptNumbers(const std::string& name) const;
  Result<Done, std::string> keep(const std::string& name, const std::string& bytes) const;
  Result<Done, std::string> replace(const std::string& name, const std::string& bytes) const;

  std::string _directory;
  FileDescriptor _lock;
};

}  // namespace veltrad::storebag
