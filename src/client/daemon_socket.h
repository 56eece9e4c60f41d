// Connects to the daemon's socket and exchanges the first frames.
#pragma once

#include <chrono>
#include <string>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "veltra/veltra.h"
#include "wire/frame.h"

namespace veltrad::client {

// The time that the daemon has to accept a connection and to send its hello.
inline constexpr std::chrono::seconds kGreetingTimeout{5};

struct ConnectFailure {
  veltra_status status;
  // One line: what is wrong and what to do.
  std::string text;
};

struct DaemonSocket {
  // Connected, blocking, close-on-exec.
  FileDescriptor socket;
  // Holds the bytes that followed the daemon's hello.
  wire::FrameReader reader;
};

// Connects to `path`, sends a hello and `firstCalls`, which are whole frames, and waits at most `patience`
// for the daemon's hello.
Result<DaemonSocket, ConnectFailure> reachDaemon(const std::string& path, const std::string& firstCalls,
                                                 std::chrono::milliseconds patience = kGreetingTimeout);

}  // namespace veltrad::client
