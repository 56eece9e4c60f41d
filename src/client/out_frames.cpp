// SPDX-License-Identifier: Apache-2.0
// Writes frames without blocking.
#include "client/out_frames.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "wire/frame.h"

namespace veltrad::client {

namespace {

constexpr std::size_t kFramesAtOnce = 64;
constexpr int kFlags = MSG_DONTWAIT | MSG_NOSIGNAL;

bool full(int error) {
  return error == EAGAIN || error == ENOBUFS;
}

ssize_t sendWithDescriptor(int socket, msghdr message, int descriptor) {
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof descriptor)] = {};
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  cmsghdr* part = CMSG_FIRSTHDR(&message);
  part->cmsg_level = SOL_SOCKET;
  part->cmsg_type = SCM_RIGHTS;
  part->cmsg_len = CMSG_LEN(sizeof descriptor);
  std::memcpy(CMSG_DATA(part), &descriptor, sizeof descriptor);
  return ::sendmsg(socket, &message, kFlags);
}

// The daemon then answers that no file was lent.
void announceNoDescriptor(std::string& frame) {
  wire::FrameHeader header = wire::decodeFrameHeader(frame.data());
  header.descriptors = 0;
  wire::encodeFrameHeader(header, frame.data());
}

}  // namespace

void OutFrames::connect(int socket, std::string first) {
  _socket = socket;
  _gate = Gate::first;
  _first = std::move(first);
}

void OutFrames::release() {
  if (_gate == Gate::first) _gate = Gate::open;
}

void OutFrames::hold() {
  _gate = Gate::apart;
}

void OutFrames::disconnect() {
  _gate = Gate::apart;
  _socket = -1;
  _first.clear();
  if (_taken == 0) return;
  _record.cut(_calls.front());
  _bytes -= _calls.front().bytes.size() - _taken;
  _calls.pop_front();
  _taken = 0;
}

void OutFrames::stop() {
  disconnect();
  _closed = true;
  for (const OutCall& call : _calls) _record.dropped(call);
  _calls.clear();
  _bytes = 0;
}

veltra_status OutFrames::write(OutCall call) {
  if (_closed) return refuse(VELTRA_NO_DAEMON);
  const std::size_t size = call.bytes.size();
  if (!_calls.empty() && _bytes + size > _most) return refuse(VELTRA_QUEUE_FULL);
  if (call.file && call.file->descriptor() < 0) call.file = nullptr;
  if (empty() && _gate == Gate::open && !call.file) {
    ssize_t count;
    do {
      count = ::send(_socket, call.bytes.data(), size, kFlags);
    } while (count < 0 && errno == EINTR);
    if (count == static_cast<ssize_t>(size)) {
      _record.written(call);
      return VELTRA_OK;
    }
    if (count < 0 && !full(errno)) hold();  // the reader will find the end of the connection
    if (count > 0) _taken = static_cast<std::size_t>(count);
  }
  _bytes += size - _taken;
  const bool first = _calls.empty();
  const bool lends = call.file != nullptr;
  _calls.push_back(std::move(call));
  if (first && lends) writeWaiting();
  return VELTRA_OK;
}

veltra_status OutFrames::refuse(veltra_status why) {
  ++_refused;
  return why;
}

bool OutFrames::writing() const {
  return _gate != Gate::apart && (!_first.empty() || (_gate == Gate::open && !_calls.empty()));
}

void OutFrames::writeWaiting() {
  if (_gate == Gate::apart) return;
  if (!writeFirst() || (_gate == Gate::open && !writeAll())) hold();
}

bool OutFrames::withdraw(std::uint32_t callID) {
  for (auto at = _calls.begin(); at != _calls.end(); ++at) {
    if (wire::decodeFrameHeader(at->bytes.data()).callID != callID) continue;
    if (at == _calls.begin() && _taken > 0) return false;
    _bytes -= at->bytes.size();
    _calls.erase(at);
    return true;
  }
  return false;
}

std::unordered_set<std::uint32_t> OutFrames::waitingIDs() const {
  std::unordered_set<std::uint32_t> found;
  for (const OutCall& call : _calls) found.insert(wire::decodeFrameHeader(call.bytes.data()).callID);
  return found;
}

// False if the connection has ended.
bool OutFrames::writeFirst() {
  while (!_first.empty()) {
    const ssize_t sent = ::send(_socket, _first.data(), _first.size(), kFlags);
    if (sent >= 0) {
      _first.erase(0, static_cast<std::size_t>(sent));
    } else if (errno != EINTR) {
      return full(errno);
    }
  }
  return true;
}

// False if the connection has ended.
bool OutFrames::writeAll() {
  while (_first.empty() && !_calls.empty()) {
    const ssize_t sent = send();
    if (sent >= 0) {
      taken(static_cast<std::size_t>(sent));
    } else if (errno == ETOOMANYREFS && _calls.front().file) {  // too many descriptors are in transit
      announceNoDescriptor(_calls.front().bytes);
      _calls.front().file = nullptr;
    } else if (errno != EINTR) {
      return full(errno);
    }
  }
  return true;
}

// Sends as many calls as possible at once. A descriptor is sent with the first byte of the first call.
ssize_t OutFrames::send() {
  iovec parts[kFramesAtOnce];
  std::size_t count = 0;
  for (OutCall& call : _calls) {
    if (count == kFramesAtOnce || (count > 0 && call.file)) break;
    const std::size_t skipped = count == 0 ? _taken : 0;
    parts[count++] = {call.bytes.data() + skipped, call.bytes.size() - skipped};
  }
  msghdr message{};
  message.msg_iov = parts;
  message.msg_iovlen = count;
  OutCall& first = _calls.front();
  if (!first.file) return ::sendmsg(_socket, &message, kFlags);
  const ssize_t sent = sendWithDescriptor(_socket, message, first.file->descriptor());
  if (sent > 0) first.file = nullptr;
  return sent;
}

void OutFrames::taken(std::size_t count) {
  _bytes -= count;
  while (count > 0) {
    const std::size_t now = std::min(count, _calls.front().bytes.size() - _taken);
    count -= now;
    _taken += now;
    if (_taken < _calls.front().bytes.size()) return;
    _record.written(_calls.front());
    _calls.pop_front();
    _taken = 0;
  }
}

}  // namespace veltrad::client
