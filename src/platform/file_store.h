// Files as the daemon reads and replaces them. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"

namespace veltrad::platform {

struct FileFailure {
  // shortage: no descriptor or memory, or an I/O error, just now. It says nothing about the file, so nobody
  // remembers it as an answer.
  enum class Kind { notFound, noAccess, tooLarge, noSpace, other, shortage };
  Kind kind;
  bool passes() const { return kind == Kind::shortage; }
  std::string description;  // names the path: "/etc/veltrad/x.plist: Permission denied"
};

using FileStamp = std::optional<std::uint64_t>;

class FileStore {
 public:
  virtual ~FileStore() = default;
  // A regular file of at most `most` bytes, whole.
  virtual Result<std::string, FileFailure> read(const std::string& path, std::size_t most = 16u << 20) = 0;
  // Writes a new file in the same directory (O_EXCL, O_NOFOLLOW, mode 0600 unless `mode` says else), syncs,
  // renames, syncs the directory. On failure the old file is untouched and the new one gone.
  virtual Result<Done, FileFailure> replace(const std::string& path, std::string_view bytes,
                                            unsigned mode = 0600) = 0;
  // Renames within one directory.
  virtual Result<Done, FileFailure> rename(const std::string& from, const std::string& to) = 0;
  // Changes when the file is written or replaced; absent while there is no such file. Fails for a shortage
  // alone.
  virtual Result<FileStamp, FileFailure> stamp(const std::string& path) = 0;
};

class DiskFileStore final : public FileStore {
 public:
  Result<std::string, FileFailure> read(const std::string& path, std::size_t most) override;
  Result<Done, FileFailure> replace(const std::string& path, std::string_view bytes, unsigned mode) override;
  Result<Done, FileFailure> rename(const std::string& from, const std::string& to) override;
  Result<FileStamp, FileFailure> stamp(const std::string& path) override;
};

// Makes the directory and its parents (mode 0755) where they are missing.
Result<Done, FileFailure> makeDirectories(const std::string& path);

// Whether files can be made in the directory, which is made where it is missing: by making one and removing
// it.
Result<Done, FileFailure> tryWritingIn(const std::string& directory);

// Removes what a replace() that was killed has left in the directory: regular files under its pattern of
// names, NAME.XXXXXXXX.new with eight hexadecimal digits. Returns how many. Before any other writer is there.
std::size_t removeUnfinishedFiles(const std::string& directory);

}  // namespace veltrad::platform
