// SPDX-License-Identifier: Apache-2.0
// Determines the kind of file system of an open file, without contacting a file server.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>

namespace veltrad::wire {

struct FileOrigin {
  // local: the kernel serves it from memory or a device. stacked: it shows the files of other file systems
  // (overlay). foreign: a program or another machine serves it, or this is unknown.
  enum class Kind { local, stacked, foreign };
  Kind kind = Kind::foreign;
  // As in /proc/self/mountinfo: "ext4", "fuse.sshfs"; "of a device": a disk's, of a type that is unknown.
  std::string fileSystem = "unknown";

  // `lender` is the process that opened the file. A stacked file system of its own mount namespace counts as
  // foreign, since what lies below is unknown.
  static FileOrigin of(int descriptor, pid_t lender);
};

// The kind of a file system, by the name of its type.
FileOrigin::Kind kindOfFileSystem(std::string_view type);
// The type of the mount with this number in a text like /proc/self/mountinfo (proc_pid_mountinfo(5)).
std::optional<std::string> typeOfMount(std::string_view mountInfo, std::string_view number);

// True for a socket, a pipe, a directory, a device and the like. False if only a file server could tell.
bool isNoRegularFile(int descriptor);

}  // namespace veltrad::wire
