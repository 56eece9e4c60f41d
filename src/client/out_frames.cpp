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

veltra_status OutFrames::write(int socket, std::string frame, std::shared_ptr<const UploadedFile> file) {
  if (_closed) return refuse(VELTRA_NO_DAEMON);
  const bool first = _frames.empty();
  if (!first && _bytes + frame.size() > _most) return refuse(VELTRA_QUEUE_FULL);
  if (file && file->descriptor() < 0) file = nullptr;
  const bool lends = file != nullptr;
  std::size_t sent = 0;
  if (first && !lends) {
    ssize_t count;
    do {
      count = ::send(socket, frame.data(), frame.size(), kFlags);
    } while (count < 0 && errno == EINTR);
    if (count < 0 && !full(errno)) {
      stop();
      return refuse(VELTRA_NO_DAEMON);
    }
    if (count > 0) sent = static_cast<std::size_t>(count);
    if (sent == frame.size()) {
      ++_written;
      return VELTRA_OK;
    }
    _firstTaken = sent;
  }
  _bytes += frame.size() - sent;
  _frames.push_back({std::move(frame), std::move(file)});
  if (!first || !lends || writeAll(socket)) return VELTRA_OK;
  _frames.clear();  // counts as refused, not as lost
  stop();
  return refuse(VELTRA_NO_DAEMON);
}

veltra_status OutFrames::refuse(veltra_status why) {
  ++_refused;
  return why;
}

void OutFrames::writeWaiting(int socket) {
  if (!writeAll(socket)) stop();
}

void OutFrames::stop() {
  _closed = true;
  _lost += _frames.size();
  _frames.clear();
  _bytes = _firstTaken = 0;
}

// False if the connection has ended.
bool OutFrames::writeAll(int socket) {
  while (!_frames.empty()) {
    const ssize_t sent = send(socket);
    if (sent >= 0) {
      taken(static_cast<std::size_t>(sent));
    } else if (errno == ETOOMANYREFS && _frames.front().file) {  // too many descriptors are in transit
      announceNoDescriptor(_frames.front().bytes);
      _frames.front().file = nullptr;
    } else if (errno != EINTR) {
      return full(errno);
    }
  }
  return true;
}

// Sends as many frames as possible at once. A descriptor is sent with the first byte of the first frame.
ssize_t OutFrames::send(int socket) {
  iovec parts[kFramesAtOnce];
  std::size_t count = 0;
  for (Waiting& frame : _frames) {
    if (count == kFramesAtOnce || (count > 0 && frame.file)) break;
    const std::size_t skipped = count == 0 ? _firstTaken : 0;
    parts[count++] = {frame.bytes.data() + skipped, frame.bytes.size() - skipped};
  }
  msghdr message{};
  message.msg_iov = parts;
  message.msg_iovlen = count;
  Waiting& first = _frames.front();
  if (!first.file) return ::sendmsg(socket, &message, kFlags);
  const ssize_t sent = sendWithDescriptor(socket, message, first.file->descriptor());
  if (sent > 0) first.file = nullptr;
  return sent;
}

void OutFrames::taken(std::size_t count) {
  _bytes -= count;
  while (count > 0) {
    const std::size_t now = std::min(count, _frames.front().bytes.size() - _firstTaken);
    count -= now;
    _firstTaken += now;
    if (_firstTaken < _frames.front().bytes.size()) return;
    _frames.pop_front();
    _firstTaken = 0;
    ++_written;
  }
}

}  // namespace veltrad::client
