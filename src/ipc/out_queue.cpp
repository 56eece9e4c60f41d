// SPDX-License-Identifier: Apache-2.0
// Writes, queues, charges and limits frames to a client.
#include "ipc/out_queue.h"

#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <utility>

#include "wire/frame.h"

namespace veltrad::ipc {

static_assert(kOutQueueBound == wire::kFrameBodyLimit + wire::kFrameHeaderBytes);

namespace {

// Limits the reads from a client that keeps writing while its connection is closed.
constexpr int kMostDrainingReads = 1024;
// A growing buffer takes up to twice the bytes that wait.
constexpr std::size_t kBytesOfByte = 2;

}  // namespace

OutQueue::OutQueue(FileDescriptor socket, platform::Counters& counters,
                   std::shared_ptr<platform::MemoryAccount> account)
    : _counters(counters),
      _account(std::move(account)),
      _readSocket(socket.get()),
      _readWakeUp(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  Lock lock(_mutex);
  _socket = std::move(socket);
  _wakeUp = FileDescriptor(_readWakeUp);
  _gone = !_socket.isOpen();
}

OutQueue::Sent OutQueue::sendReply(std::string_view frame) {
  return counted(put(frame, Kind::reply));
}

OutQueue::Sent OutQueue::sendOutcomes(std::uint32_t callID, const wire::Outcomes& outcomes) {
  Sent sent;
  {
    const Lock lock(_mutex);
    sent = putLocked(_lastSent.of(callID, outcomes), Kind::reply);
  }
  return counted(sent);
}

// Counts what became of a reply.
OutQueue::Sent OutQueue::counted(Sent sent) {
  if (sent == Sent::full) {
    _counters.count(wire::Reason::replies_unread);
    requestEnd();
  } else if (sent == Sent::gone) {
    _counters.count(wire::Reason::reply_client_gone);
  }
  return sent;
}

OutQueue::Sent OutQueue::sendEvent(std::string_view frame) {
  const Sent sent = put(frame, Kind::event);
  if (sent == Sent::full) {
    _counters.count(wire::Reason::client_does_not_read);
  } else if (sent == Sent::gone) {
    _counters.count(wire::Reason::client_gone);
  } else if (sent == Sent::tooLarge) {
    _counters.count(wire::Reason::frame_too_large);
  }
  return sent;
}

OutQueue::Sent OutQueue::put(std::string_view frame, Kind kind) {
  const Lock lock(_mutex);
  return putLocked(frame, kind);
}

OutQueue::Sent OutQueue::putLocked(std::string_view frame, Kind kind) {
  const std::size_t bound = kOutQueueBound + (kind == Kind::reply ? kReplyReserve : 0);
  if (frame.size() > wire::kFrameBodyLimit + wire::kFrameHeaderBytes) return Sent::tooLarge;
  const std::size_t whole = frame.size();
  if (_gone) return Sent::gone;
  if (_waiting.empty() && _held && charge(frame.size(), kind)) {
    // The connection's thread writes it soon.
    _waiting.assign(frame);
    _waitingBytes.store(_waiting.size(), std::memory_order_relaxed);
    return Sent::done;
  }
  if (_waiting.empty()) {
    if (!writeSome(frame)) return Sent::gone;
    if (frame.empty()) return Sent::done;
    // A frame that was written in part must be completed.
    const bool begun = frame.size() < whole;
    if (!charge(frame.size(), kind) && !begun) return Sent::full;
    _waiting.assign(frame);
    _waitingBytes.store(_waiting.size(), std::memory_order_relaxed);
    wake();
    return Sent::done;
  }
  if (_waiting.size() - _written + frame.size() > bound || !charge(frame.size(), kind)) return Sent::full;
  if (_written > _waiting.size() / 2) {
    _waiting.erase(0, _written);
    _written = 0;
  }
  _waiting.append(frame);
  _waitingBytes.store(_waiting.size() - _written, std::memory_order_relaxed);
  return Sent::done;
}

bool OutQueue::charge(std::size_t bytes, Kind kind) {
  if (!_account) return true;
  const bool reply = kind == Kind::reply;
  auto more = _account->tryCharge(kBytesOfByte * bytes,
                                  reply ? platform::MemoryUse::working : platform::MemoryUse::kept);
  if (more) (reply ? _replies : _events).add(std::move(*more));
  return more.has_value();
}

// Releases the charge of what was written, of either kind.
void OutQueue::payBack(std::size_t waiting) {
  const std::size_t wanted = kBytesOfByte * waiting;
  const std::size_t replies = std::min(_replies.bytes(), wanted);
  [[maybe_unused]] const bool less =
      _events.resize(std::min(_events.bytes(), wanted - replies)) && _replies.resize(replies);
}

// Removes what was written from `bytes`. False if the client has gone.
bool OutQueue::writeSome(std::string_view& bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(_socket.get(), bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (count >= 0) {
      bytes.remove_prefix(static_cast<std::size_t>(count));
    } else if (errno == EAGAIN || errno == EWOULDBLOCK || errno == ENOBUFS || errno == ENOMEM) {
      return true;
    } else if (errno != EINTR) {
      giveUp();
      return false;
    }
  }
  return true;
}

void OutQueue::requestEnd() {
  _endRequested.store(true, std::memory_order_relaxed);
  Lock lock(_mutex);
  wake();
}

void OutQueue::wakeReader() {
  Lock lock(_mutex);
  wake();
}

void OutQueue::stopReading() {
  Lock lock(_mutex);
  if (_socket.isOpen()) ::shutdown(_socket.get(), SHUT_RD);
  wake();
}

void OutQueue::wake() {
  if (_wakeUp.isOpen()) ::eventfd_write(_wakeUp.get(), 1);  // fails only if a wake-up is pending
}

void OutQueue::drainWakeUp() {
  eventfd_t count = 0;
  ::eventfd_read(_readWakeUp, &count);
}

// Nothing more can be written.
void OutQueue::giveUp() {
  _gone = true;
  _waiting = std::string();
  _written = 0;
  _events.release();
  _replies.release();
  _waitingBytes.store(0, std::memory_order_relaxed);
}

void OutQueue::hold() {
  if (std::exchange(_holds, true)) return;
  Lock lock(_mutex);
  _held = true;
}

std::size_t OutQueue::flush() {
  if (!_holds && waitingBytes() == 0) return 0;
  _holds = false;
  Lock lock(_mutex);
  _held = false;
  if (_waiting.empty()) return 0;
  std::string_view rest = std::string_view(_waiting).substr(_written);
  if (!writeSome(rest)) return 0;
  _written = _waiting.size() - rest.size();
  _waitingBytes.store(rest.size(), std::memory_order_relaxed);
  payBack(rest.size());
  if (!rest.empty()) return rest.size();
  _written = 0;
  _waiting = std::string();
  return 0;
}

void OutQueue::close() {
  FileDescriptor socket;
  {
    Lock lock(_mutex);
    giveUp();
    socket = std::move(_socket);
    _wakeUp.reset();
  }
  if (socket.isOpen()) closeGently(std::move(socket));
}

void closeGently(FileDescriptor socket) {
  // After the shutdown the peer cannot write. Closing with an empty receive queue lets it read what was
  // written.
  ::shutdown(socket.get(), SHUT_RDWR);
  char bytes[4096];
  for (int i = 0; i < kMostDrainingReads; ++i) {
    const ssize_t count = ::recv(socket.get(), bytes, sizeof bytes, MSG_DONTWAIT);
    if (count == 0 || (count < 0 && errno != EINTR)) return;
  }
}

}  // namespace veltrad::ipc
