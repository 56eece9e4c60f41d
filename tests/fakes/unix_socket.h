// SPDX-License-Identifier: Apache-2.0
// Unix sockets in a directory of the test's own. Test thread.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include "base/file_descriptor.h"
#include "fakes/temporary_directory.h"

namespace veltrad {

// A Unix socket bound to `path` or connected to it.
template <typename Attach>
FileDescriptor unixSocket(Attach attach, const std::string& path, int type = SOCK_STREAM) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  FileDescriptor made(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
  EXPECT_EQ(attach(made.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0) << path;
  return made;
}

}  // namespace veltrad
