// SPDX-License-Identifier: Apache-2.0
// Parses replies, events and the end of a connection.
#include "client/answer_reader.h"

#include <sys/socket.h>

#include <cerrno>
#include <utility>

#include "base/property_list.h"
#include "base/text.h"
#include "wire/limits.h"

namespace veltrad::client {

namespace {
constexpr std::size_t kReadBytes = 16u << 10;
}

void AnswerReader::restart(wire::FrameReader frames, bool greeted) {
  _frames = std::move(frames);
  _greeted = greeted;
  _unparsed = greeted;
}

AnswerReader::Got AnswerReader::receive(int socket, int flags) {
  if (std::exchange(_unparsed, false)) {
    if (!takeFrames()) return Got::end;
    if (!_arrived.empty()) return Got::something;
  }
  const auto [bytes, room] = _frames.room(kReadBytes);
  const ssize_t count = ::recv(socket, bytes, room, flags);
  if (count < 0 && (errno == EAGAIN || errno == EINTR)) return Got::nothing;
  if (count < 0) return Got::reset;
  if (count == 0) return Got::end;
  _frames.received(static_cast<std::size_t>(count));
  return takeFrames() ? Got::something : Got::end;
}

bool AnswerReader::takeFrames() {
  wire::Frame frame;
  for (;;) {
    switch (_frames.next(frame)) {
      case wire::FrameReader::Next::needMore:
        return true;
      case wire::FrameReader::Next::impossible:
        return false;
      case wire::FrameReader::Next::frame:
        take(frame);
    }
  }
}

void AnswerReader::take(const wire::Frame& frame) {
  if (!std::exchange(_greeted, true) || frame.header.kind == wire::FrameKind::refusal) {
    auto failure = verdictOnGreeting(frame, escapedForLog(_path));
    const auto kind = failure ? Arrived::Kind::refusal : Arrived::Kind::greeting;
    _arrived.push_back({kind, 0, nullptr, {}, std::move(failure)});
  } else if (frame.header.kind == wire::FrameKind::reply && frame.header.callID != 0) {
    _arrived.push_back({Arrived::Kind::answer, frame.header.callID, answerOfReply(frame.body)});
  } else if (frame.header.kind == wire::FrameKind::event) {
    auto body = parseBinaryPropertyList(frame.body, wire::kDaemonFrameLimits);
    const Dictionary* event = body ? body.value().asDictionary() : nullptr;
    if (event) _arrived.push_back({Arrived::Kind::event, 0, nullptr, *event});
  }
}

}  // namespace veltrad::client
