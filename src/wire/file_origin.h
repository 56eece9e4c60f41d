// Where an open file's bytes come from, found out without asking whoever serves them. Any thread.
#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <string_view>

namespace veltrad::wire {

struct FileOrigin {
  enum class Kind {
    local,    // the kernel's own: memory, or a device that it reads itself
    stacked,  // shows the files of others, whatever those are: overlay
    foreign,  // a program or another machine answers, or does not; or nobody can tell
  };
  Kind kind = Kind::foreign;
  std::string fileSystem = "unknown";  // as /proc/self/mountinfo names it: "ext4", "fuse.sshfs"

  // Whether a read of it ends by the kernel's word alone. `lender`: who opened it, perhaps in a mount
  // namespace of its own; what is stacked there may be stacked on anything.
  static FileOrigin of(int descriptor, pid_t lender);
};

// The verdict on a type's name.
FileOrigin::Kind kindOfFileSystem(std::string_view type);
// The type of the mount with this number in a text like /proc/self/mountinfo (proc_pid_mountinfo(5)).
std::optional<std::string> typeOfMount(std::string_view mountInfo, std::string_view number);

// Certainly none: a socket, a pipe, a directory, a device or the like. What cannot be told without asking the
// file's server is not.
bool isNoRegularFile(int descriptor);

}  // namespace veltrad::wire
