// Reaching the daemon: connecting to its socket and the exchange of the first frames. On the thread of the
// caller of veltra_session_create.
#pragma once

#include <chrono>
#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "veltra/veltra.h"
#include "wire/frame.h"

namespace veltrad::client {

// How long a daemon may take to accept a connection and to say hello.
inline constexpr std::chrono::seconds kGreetingTimeout{5};

struct ConnectFailure {
  veltra_status status;
  std::string text;  // one line: what is wrong and what to do
};

struct DaemonSocket {
  FileDescriptor socket;     // connected, blocking, close-on-exec
  wire::FrameReader reader;  // holds what came after the daemon's hello
};

// Connects to `path`, says hello and sends `firstCalls` (whole frames) behind it, and waits for the daemon's
// hello, for `patience` at most.
Result<DaemonSocket, ConnectFailure> reachDaemon(const std::string& path, const std::string& firstCalls,
                                                 std::chrono::milliseconds patience = kGreetingTimeout);

}  // namespace veltrad::client
