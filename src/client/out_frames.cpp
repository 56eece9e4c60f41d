// Writing frames without blocking. Under the connection's lock.
#include "client/out_frames.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cerrno>

namespace veltrad {

namespace {
constexpr std::size_t kFramesAtOnce = 64;
constexpr int kFlags = MSG_DONTWAIT | MSG_NOSIGNAL;
}  // namespace

OutFrames::Wrote OutFrames::write(int socket, std::string frame) {
  if (!_frames.empty()) {
    _bytes += frame.size();
    _frames.push_back(std::move(frame));
    return Wrote::some;
  }
  ssize_t count;
  do {
    count = ::send(socket, frame.data(), frame.size(), kFlags);
  } while (count < 0 && errno == EINTR);
  if (count < 0 && errno != EAGAIN && errno != ENOBUFS) return Wrote::gone;
  const std::size_t taken = count > 0 ? static_cast<std::size_t>(count) : 0;
  if (taken == frame.size()) {
    ++_written;
    return Wrote::all;
  }
  _bytes = frame.size() - taken;
  _firstTaken = taken;
  _frames.push_back(std::move(frame));
  return Wrote::some;
}

OutFrames::Wrote OutFrames::writeWaiting(int socket) {
  while (!_frames.empty()) {
    iovec parts[kFramesAtOnce];
    std::size_t count = 0;
    for (std::string& frame : _frames) {
      const std::size_t skipped = count == 0 ? _firstTaken : 0;
      parts[count++] = {frame.data() + skipped, frame.size() - skipped};
      if (count == kFramesAtOnce) break;
    }
    msghdr message{};
    message.msg_iov = parts;
    message.msg_iovlen = count;
    const ssize_t sent = ::sendmsg(socket, &message, kFlags);
    if (sent < 0 && errno == EINTR) continue;
    if (sent < 0) return errno == EAGAIN || errno == ENOBUFS ? Wrote::some : Wrote::gone;
    taken(static_cast<std::size_t>(sent));
  }
  return Wrote::all;
}

void OutFrames::taken(std::size_t count) {
  _bytes -= count;
  while (count > 0) {
    const std::size_t now = std::min(count, _frames.front().size() - _firstTaken);
    count -= now;
    _firstTaken += now;
    if (_firstTaken < _frames.front().size()) return;
    _frames.pop_front();
    _firstTaken = 0;
    ++_written;
  }
}

std::uint64_t OutFrames::clear() {
  const std::uint64_t lost = _frames.size();
  _frames.clear();
  _bytes = _firstTaken = 0;
  return lost;
}

}  // namespace veltrad
