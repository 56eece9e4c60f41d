// SPDX-License-Identifier: Apache-2.0
// Uses O_TMPFILE where the file system has it, so the file never has a name.
#include "backends/upload/compressed_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

namespace veltrad::backends {

bool CompressedFile::append(std::string_view bytes) {
  if (!_file) {
    if (_start.size() + bytes.size() <= kMostInMemory) {
      _start += bytes;
      return true;
    }
    if (!open() || !write(_start)) return false;
    _start = std::string();
  }
  return write(bytes);
}

bool CompressedFile::open() {
  FileDescriptor file(::open(_directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  if (!file.isOpen() && (errno == EOPNOTSUPP || errno == EISDIR || errno == EINVAL || errno == ENOENT)) {
    // If the process is killed between the two calls, the next start removes the file.
    std::string name = _directory + "/upload-XXXXXX.new";
    file.reset(::mkostemps(name.data(), 4, O_CLOEXEC));
    if (file.isOpen()) ::unlink(name.c_str());
  }
  if (!file.isOpen()) return false;
  _file = std::make_shared<FileDescriptor>(std::move(file));
  return true;
}

bool CompressedFile::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(_file->get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
    _written += static_cast<std::uint64_t>(count);
  }
  return true;
}

void CompressedFile::become(http::HTTPRequest& request) {
  if (_file) {
    request.fileBody = http::FileBody{std::move(_file), _written};
  } else {
    request.body = std::move(_start);
  }
}

}  // namespace veltrad::backends
