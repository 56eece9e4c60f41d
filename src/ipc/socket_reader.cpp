// SPDX-License-Identifier: Apache-2.0
// Reads with recvmsg, and charges the buffer.
#include "ipc/socket_reader.h"

#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <tuple>

#include "wire/file_origin.h"

namespace veltrad::ipc {

namespace {

constexpr std::size_t kLeastRoom = wire::kIdleReadBytes;
// The memory of a large call in relation to its body: the frame, its values, and what is made from them.
constexpr std::size_t kLargeCallFactor = 3;
constexpr std::size_t kMostRoom = 64u << 10;
constexpr std::size_t kDescriptorsAtOnce = 4;
// A client may send several frames with one descriptor each in a single message.
constexpr std::size_t kMostDescriptors = 16;

// False if there were too many.
bool takeControl(msghdr& message, std::deque<FileDescriptor>& into) {
  for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int number = -1;
      std::memcpy(&number, CMSG_DATA(part) + i * sizeof number, sizeof number);
      FileDescriptor came(number);
      // Closed at once, or a client that sends its own end would keep its connection open. The closed one
      // keeps its place, so that the frame that announced it runs without a file.
      if (wire::isNoRegularFile(number)) came.reset();
      into.push_back(std::move(came));
    }
  }
  return (message.msg_flags & MSG_CTRUNC) == 0 && into.size() <= kMostDescriptors;
}

}  // namespace

SocketReader::Got SocketReader::receive(int socket) {
  auto [place, size] = _frames.room(std::max(_wanted, kLeastRoom));
  if (!place) std::tie(place, size) = _frames.room(1);
  if (!place) return Got::noRoom;
  iovec bytes{place, size};
  alignas(cmsghdr) char control[CMSG_SPACE(kDescriptorsAtOnce * sizeof(int))];
  msghdr message{};
  message.msg_iov = &bytes;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  ssize_t count;
  do {
    count = ::recvmsg(socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  } while (count < 0 && errno == EINTR);
  if (count < 0) {
    _moreLikely = false;
    return errno == EAGAIN || errno == EWOULDBLOCK ? Got::nothing : Got::end;
  }
  const bool fits = takeControl(message, _descriptors);
  if (!fits) return Got::badDescriptors;
  if (count == 0) return Got::end;
  const auto came = static_cast<std::size_t>(count);
  _frames.received(came);
  // Descriptors and a full buffer both end a read before all bytes were read.
  _moreLikely = came == size || message.msg_controllen > 0;
  _wanted = came == size ? kMostRoom : kLeastRoom;
  return Got::bytes;
}

bool SocketReader::bufferOf(std::size_t bytes) {
  if (!_account || _large.bytes() > 0) return true;
  const std::size_t wanted = bytes > wire::kIdleReadBytes ? bytes - wire::kIdleReadBytes : 0;
  if (wanted > _charge.bytes()) return chargeMore(wanted - _charge.bytes());
  return _charge.resize(wanted);
}

bool SocketReader::chargeMore(std::size_t bytes) {
  _lacking = bytes;
  for (;;) {
    if (auto more = _account->tryCharge(bytes, platform::MemoryUse::unfinished)) {
      _charge.add(std::move(*more));
      return true;
    }
    // Older data of the user, such as batches, is dropped to make room.
    if (hopeless() || !_account->dropOldest()) return false;
  }
}

bool SocketReader::hopeless() const {
  return _account && _account->unfinishedFull(_lacking);
}

bool SocketReader::admitLargeCall(const wire::FrameHeader& header) {
  if (!_account) return true;
  auto charge = _account->tryCharge(kLargeCallFactor * header.bodyLength, platform::MemoryUse::working);
  if (charge) _large = std::move(*charge);
  return charge.has_value();
}

std::optional<FileDescriptor> SocketReader::takeDescriptor() {
  if (_descriptors.empty()) return std::nullopt;
  FileDescriptor first = std::move(_descriptors.front());
  _descriptors.pop_front();
  return first;
}

}  // namespace veltrad::ipc
