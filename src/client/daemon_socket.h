// SPDX-License-Identifier: Apache-2.0
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

// impossible: the bytes are no frame. end: the daemon has ended the connection.
enum class Received { frame, end, timeout, impossible };
// Waits until `deadline` for a whole frame.
Received receiveFrame(DaemonSocket& daemon, std::chrono::steady_clock::time_point deadline,
                      wire::Frame& frame);

}  // namespace veltrad::client
