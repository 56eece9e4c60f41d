// SPDX-License-Identifier: Apache-2.0
// Reads and parses the frames of the daemon. Used by one thread at a time, without a lock.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/value.h"
#include "client/answer.h"
#include "client/daemon_socket.h"
#include "wire/frame.h"

namespace veltrad::client {

// One frame of the daemon.
struct Arrived {
  enum class Kind { greeting, refusal, answer, event };
  Kind kind;
  std::uint32_t callID = 0;
  Answer answer = nullptr;
  // The body of an event.
  Dictionary event = {};
  // Set for a refusal, and for a hello that cannot be used.
  std::optional<ConnectFailure> failure = {};
};

class AnswerReader {
 public:
  // reset: the daemon has ended the connection without having read everything.
  enum class Got { something, nothing, end, reset };

  // `path` is for error texts.
  explicit AnswerReader(std::string path) : _path(std::move(path)) {}

  // Starts reading from the next connection. `frames` may already hold frames; `greeted` says that the
  // daemon's hello was already received.
  void restart(wire::FrameReader frames, bool greeted);
  // Receives once, with these flags. What has arrived before is parsed first, instead.
  Got receive(int socket, int flags);
  // The arrived frames, in order. The caller empties the vector.
  std::vector<Arrived>& arrived() { return _arrived; }

 private:
  bool takeFrames();
  void take(const wire::Frame& frame);

  const std::string _path;
  wire::FrameReader _frames;
  bool _greeted = false;
  // There may be frames that were not parsed.
  bool _unparsed = false;
  std::vector<Arrived> _arrived;
};

}  // namespace veltrad::client
