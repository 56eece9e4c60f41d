// SPDX-License-Identifier: Apache-2.0
// The compressed form of a file: in memory while it is small, else in a file that has no name.
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

  // `directory`: where files can be made.
  explicit CompressedFile(std::string directory) : _directory(std::move(directory)) {}

  // False if there is no room; errno says why. Leaves no file behind.
  bool append(std::string_view bytes);
  // Moves the content into the request.
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
