// What a file's compression makes, until it has been sent: in memory while it is small, else in a file that
// has no name. One thread at a time.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "http/http_client.h"

namespace veltrad::backends {

class CompressedFile {
 public:
  static constexpr std::size_t kMostInMemory = 256u << 10;

  // Of a directory on a disk with room, where files may be made.
  explicit CompressedFile(std::string directory) : _directory(std::move(directory)) {}

  // False: there is no room, and errno says why. Nothing stays behind.
  bool append(std::string_view bytes);
  // Moves all that was appended into the request.
  void become(http::HTTPRequest& request);

 private:
  bool open();
  bool write(std::string_view bytes);

  const std::string _directory;
  std::string _start;
  std::shared_ptr<FileDescriptor> _file;
  std::uint64_t _written = 0;
};

}  // namespace veltrad::backends
