// SPDX-License-Identifier: Apache-2.0
// Reading and replacing whole files, from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "platform/place.h"

namespace veltrad::platform {

struct FileFailure {
  // shortage: no descriptor or memory, or an I/O error. It says nothing about the file and must not be
  // cached.
  enum class Kind { notFound, noAccess, tooLarge, noSpace, other, shortage };
  Kind kind;
  bool passes() const { return kind == Kind::shortage; }
  // "/etc/veltrad/x.plist: Permission denied"
  std::string description;
};

using FileStamp = std::optional<std::uint64_t>;

class FileStore {
 public:
  virtual ~FileStore() = default;
  // The content of a regular file of at most `most` bytes.
  virtual Result<std::string, FileFailure> read(const std::string& path, std::size_t most = 16u << 20) = 0;
  // Writes a new file in the same directory (O_EXCL, O_NOFOLLOW), syncs it, renames it and syncs the
  // directory. On failure the old file is unchanged and the new one is removed.
  virtual Result<Done, FileFailure> replace(const std::string& path, std::string_view bytes,
                                            unsigned mode = 0600) = 0;
  // Renames within one directory.
  virtual Result<Done, FileFailure> rename(const std::string& from, const std::string& to) = 0;
  // Removes a file; one that is not there is removed already.
  virtual Result<Done, FileFailure> unlink(const std::string& path) = 0;
  // Changes when the file is written or replaced; absent while there is no such file. Fails only because of a
  // shortage.
  virtual Result<FileStamp, FileFailure> stamp(const std::string& path) = 0;
};

class DiskFileStore final : public FileStore {
 public:
  explicit DiskFileStore(Ownership ownership = Ownership::own) : _ownership(ownership) {}
  Result<std::string, FileFailure> read(const std::string& path, std::size_t most) override;
  Result<Done, FileFailure> replace(const std::string& path, std::string_view bytes, unsigned mode) override;
  Result<Done, FileFailure> rename(const std::string& from, const std::string& to) override;
  Result<Done, FileFailure> unlink(const std::string& path) override;
  Result<FileStamp, FileFailure> stamp(const std::string& path) override;

 private:
  const Ownership _ownership;
};

// Makes the directory and its parents where they are missing.
Result<Done, FileFailure> makeDirectories(const std::string& path, unsigned mode = 0755,
                                          Ownership ownership = Ownership::own);

// Whether files can be made in the directory, which is made where it is missing: by making one and removing
// it.
Result<Done, FileFailure> tryWritingIn(const std::string& directory);

// Removes what a replace() that was killed has left in the directory: regular files under its pattern of
// names, NAME.XXXXXXXX.new with eight hexadecimal digits. Returns how many. Before any other writer is there.
std::size_t removeUnfinishedFiles(const std::string& directory);

}  // namespace veltrad::platform
