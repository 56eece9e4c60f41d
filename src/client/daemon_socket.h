// SPDX-License-Identifier: Apache-2.0
// Connects to the daemon's socket and exchanges the first frames.
#pragma once

#include <chrono>
#include <optional>
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

// Connects without waiting, for a thread that waits for other things too. The hello is the caller's to send.
Result<FileDescriptor, ConnectFailure> connectAtOnce(const std::string& path);
// Why this first frame of the daemon, or this refusal, is no hello that can be used; absent if it can.
// `shown` is the socket's path as texts show it.
std::optional<ConnectFailure> verdictOnGreeting(const wire::Frame& frame, const std::string& shown);
// The text of a daemon that has sent no hello in time.
ConnectFailure unansweredGreeting(const std::string& path, std::chrono::milliseconds patience);
std::string helloFrame();
// Why no socket can have this path; absent if one can.
std::optional<ConnectFailure> verdictOnPath(const std::string& path);

// impossible: the bytes are no frame. end: the daemon has ended the connection.
enum class Received { frame, end, timeout, impossible };
// Waits until `deadline` for a whole frame.
Received receiveFrame(DaemonSocket& daemon, std::chrono::steady_clock::time_point deadline,
                      wire::Frame& frame);

}  // namespace veltrad::client
