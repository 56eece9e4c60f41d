// Which errors of the system pass by themselves. A pure function; any thread.
#pragma once

#include <cerrno>

namespace veltrad::platform {

// No descriptor, no memory, or a device that failed just now: an error of this one attempt, which nothing
// remembers as an answer.
constexpr bool isShortage(int error) {
  return error == EMFILE || error == ENFILE || error == ENOMEM || error == EAGAIN || error == EIO ||
         error == ENOBUFS;
}

}  // namespace veltrad::platform
