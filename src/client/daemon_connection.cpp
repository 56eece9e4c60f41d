// SPDX-License-Identifier: Apache-2.0
// Sends calls, receives answers and events, and runs callbacks.
#include "client/daemon_connection.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "base/property_list.h"
#include "client/calls.h"
#include "wire/limits.h"

namespace veltrad::client {

namespace {

constexpr std::chrono::seconds kClosingTimeout{2};
constexpr std::size_t kReadBytes = 16u << 10;
// Large enough for the callbacks; only pages that were touched take memory.
constexpr std::size_t kStackBytes = 4u << 20;
constexpr std::uint32_t kHangUps = EPOLLRDHUP | EPOLLHUP | EPOLLERR;
constexpr const char* kConnectionEnded = "The connection to the daemon ended before the answer came.";

void setCallID(std::string& frame, std::uint32_t callID) {
  wire::FrameHeader header = wire::decodeFrameHeader(frame.data());
  header.callID = callID;
  wire::encodeFrameHeader(header, frame.data());
}

}  // namespace

std::shared_ptr<DaemonConnection> DaemonConnection::make(DaemonSocket daemon, std::size_t queueBytes,
                                                         EventHandler handler, std::string& error) {
  std::unique_ptr<DaemonConnection> made(
      new DaemonConnection(std::move(daemon), queueBytes, std::move(handler)));
  Lock lock(made->_lock);
  made->_interest = EPOLLRDHUP | (made->_handler ? EPOLLIN : 0u);
  epoll_event socketEvent{};
  socketEvent.events = made->_interest;
  socketEvent.data.fd = made->_socket.get();
  epoll_event wakeUpEvent{};
  wakeUpEvent.events = EPOLLIN;
  wakeUpEvent.data.fd = made->_wakeUp.get();
  if (!made->_epoll.isOpen() || !made->_wakeUp.isOpen() ||
      ::epoll_ctl(made->_epoll.get(), EPOLL_CTL_ADD, made->_socket.get(), &socketEvent) != 0 ||
      ::epoll_ctl(made->_epoll.get(), EPOLL_CTL_ADD, made->_wakeUp.get(), &wakeUpEvent) != 0) {
    error = fmt::format("The session got no descriptors: {}; raise the limit on open files.",
                        std::error_code(errno, std::generic_category()).message());
    return nullptr;
  }
  DaemonConnection* connection = made.get();
  if (!made->_thread.start("veltra", kStackBytes, [connection] { connection->run(); })) {
    error = "The session got no thread: raise the limit on tasks.";
    return nullptr;
  }
  return made;
}

DaemonConnection::DaemonConnection(DaemonSocket daemon, std::size_t queueBytes, EventHandler handler)
    : _socket(std::move(daemon.socket)),
      _epoll(::epoll_create1(EPOLL_CLOEXEC)),
      _wakeUp(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
      _handler(std::move(handler)),
      _frames(std::move(daemon.reader)),
      _out(queueBytes) {}

DaemonConnection::~DaemonConnection() {
  if (_thread.running()) close();
}

// ---- Calls ----

veltra_status DaemonConnection::send(std::string frame, veltra_callback callback, void* context, File file) {
  Lock lock(_lock);
  return enqueue(std::move(frame), {nullptr, callback, context, std::move(file)});
}

Answer DaemonConnection::sendAndWait(std::string frame, File file) {
  if (onOwnThread()) return answerOfStatus(VELTRA_WOULD_DEADLOCK);
  Waiter waiter;
  Lock lock(_lock);
  const veltra_status status = enqueue(std::move(frame), {&waiter, nullptr, nullptr, std::move(file)});
  if (status != VELTRA_OK) return answerOfStatus(status);
  while (!waiter.answer) {
    if (_reader == Reader::nobody) {
      readAsWaiter(waiter);
    } else {
      _parked.push_back(&waiter);
      waiter.changed.wait(_lock);
      std::erase(_parked, &waiter);
    }
  }
  if (_reader == Reader::nobody) passOnReading();
  return std::move(waiter.answer);
}

veltra_status DaemonConnection::enqueue(std::string frame, CallTable::Call call) {
  if (!_out.empty()) writeWaiting();  // the thread may be inside a callback
  const std::uint32_t callID = call.awaitsAnswer() ? _calls.freeID() : 0;
  if (callID != 0) setCallID(frame, callID);
  const veltra_status status = _out.write(_socket.get(), std::move(frame), call.file);
  if (status != VELTRA_OK) return status;
  if (callID != 0) _calls.add(callID, std::move(call));
  updateInterest();
  return VELTRA_OK;
}

// If the daemon has ended, answers that it sent before are still read; the end of the connection follows
// them.
void DaemonConnection::writeWaiting() {
  _out.writeWaiting(_socket.get());
  updateInterest();
}

// ---- Answers ----

void DaemonConnection::waitForSocket(short events, int milliseconds) {
  pollfd watched{_socket.get(), events, 0};
  ::poll(&watched, 1, milliseconds);
}

DaemonConnection::Received DaemonConnection::receive(int flags) {
  const auto [bytes, room] = _frames.room(kReadBytes);
  const ssize_t count = ::recv(_socket.get(), bytes, room, flags);
  if (count < 0 && (errno == EAGAIN || errno == EINTR)) return Received::nothing;
  if (count <= 0) return Received::end;
  _frames.received(static_cast<std::size_t>(count));
  return takeFrames() ? Received::something : Received::end;
}

bool DaemonConnection::takeFrames() {
  wire::Frame frame;
  for (;;) {
    switch (_frames.next(frame)) {
      case wire::FrameReader::Next::needMore:
        return true;
      case wire::FrameReader::Next::impossible:
        return false;
      case wire::FrameReader::Next::frame:
        break;
    }
    if (frame.header.kind == wire::FrameKind::refusal) return false;
    if (frame.header.kind == wire::FrameKind::reply && frame.header.callID != 0) {
      _arrived.push_back({frame.header.callID, answerOfReply(frame.body), {}});
    } else if (frame.header.kind == wire::FrameKind::event) {
      auto body = parseBinaryPropertyList(frame.body, wire::kDaemonFrameLimits);
      const Dictionary* event = body ? body.value().asDictionary() : nullptr;
      if (event) _arrived.push_back({0, nullptr, *event});
    }
  }
}

void DaemonConnection::readAsWaiter(const Waiter& waiter) {
  _reader = Reader::waiter;
  updateInterest();
  while (!waiter.answer) {
    // This call may still wait to be written, while the connection's thread is inside a callback.
    const bool writing = !_out.empty();
    _lock.unlock();
    if (writing) waitForSocket(POLLIN | POLLOUT);
    // Blocking in recv() saves the call of poll().
    const Received received = receive(writing ? MSG_DONTWAIT : 0);
    _lock.lock();
    deliver();
    if (received == Received::end) end();
    if (writing) writeWaiting();
  }
  _reader = Reader::nobody;
}

void DaemonConnection::readAsOwnThread() {
  _reader = Reader::ownThread;
  Received received;
  do {
    _lock.unlock();
    received = receive(MSG_DONTWAIT);
    _lock.lock();
    deliver();
  } while (_hungUp && received == Received::something);
  if (_hungUp || received == Received::end) end();
  passOnReading();
}

void DaemonConnection::passOnReading() {
  _reader = Reader::nobody;
  if (_ended) return;
  if (!_parked.empty()) {
    _parked.front()->changed.notifyOne();
  } else if (_hungUp) {
    wake();
  } else {
    updateInterest();
  }
}

void DaemonConnection::deliver() {
  const bool idle = !_calls.anyReady();
  for (Arrived& arrived : _arrived) {
    if (arrived.callID != 0) {
      _calls.answer(arrived.callID, std::move(arrived.answer));
    } else if (const auto callID = callToRemoveFileOf(arrived.event)) {
      _calls.askForRemoval(*callID);
    } else if (_handler) {
      _calls.addEvent(std::move(arrived.event));
    }
  }
  _arrived.clear();
  if (idle && _calls.anyReady() && !onOwnThread()) wake();
}

// ---- The end ----

void DaemonConnection::end() {
  if (_ended) return;
  _ended = true;
  _out.stop();
  unwatch();
  _calls.endAll(kConnectionEnded);
  if (_calls.anyReady() && !onOwnThread()) wake();
}

std::uint64_t DaemonConnection::close() {
  using std::chrono::steady_clock;
  const auto deadline = steady_clock::now() + kClosingTimeout;
  {
    Lock lock(_lock);
    _out.close();
    while (!_out.empty() && steady_clock::now() < deadline) {
      const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - steady_clock::now());
      _lock.unlock();
      waitForSocket(POLLOUT, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
      _lock.lock();
      writeWaiting();
    }
    end();
    ::shutdown(_socket.get(), SHUT_RDWR);  // makes a thread that reads return
    _stopping = true;
    wake();
  }
  _thread.join();
  Lock lock(_lock);
  return _out.lost();
}

veltra_statistics DaemonConnection::statistics() {
  Lock lock(_lock);
  veltra_statistics counts = _calls.counts();
  counts.sent = _out.written();
  counts.queued = _out.calls();
  counts.dropped = _out.dropped();
  return counts;
}

// ---- The connection's thread ----

void DaemonConnection::run() {
  _ownThread.store(std::this_thread::get_id(), std::memory_order_relaxed);
  const bool open = takeFrames();
  {
    Lock lock(_lock);
    deliver();
    if (!open) end();
    passOnReading();
  }
  while (runReady()) {
    epoll_event events[2];
    const int count = ::epoll_wait(_epoll.get(), events, 2, -1);
    std::uint32_t onSocket = 0;
    for (int i = 0; i < count; ++i) {
      if (events[i].data.fd == _socket.get()) {
        onSocket = events[i].events;
      } else {
        eventfd_t wakes;
        ::eventfd_read(_wakeUp.get(), &wakes);
      }
    }
    serve(onSocket);
  }
}

void DaemonConnection::serve(std::uint32_t events) {
  Lock lock(_lock);
  if (events & EPOLLOUT) writeWaiting();
  if (events & kHangUps) {
    _hungUp = true;
    unwatch();  // or epoll would report it again and again while a waiting thread reads
  }
  if (((events & EPOLLIN) || _hungUp) && _reader == Reader::nobody && !_ended) readAsOwnThread();
}

// False if the thread is to end.
bool DaemonConnection::runReady() {
  std::deque<CallTable::Ready> batch;
  {
    Lock lock(_lock);
    _calls.takeReady(batch);
  }
  for (CallTable::Ready& item : batch) {
    if (!item.answer) {
      _handler(item.event);
      continue;
    }
    settleUpload(*item.answer);
    if (item.callback) item.callback(item.context, item.answer.get());
  }
  Lock lock(_lock);
  return !_stopping || _calls.anyReady();
}

void DaemonConnection::wake() {
  ::eventfd_write(_wakeUp.get(), 1);
}

void DaemonConnection::unwatch() {
  if (std::exchange(_watched, false)) ::epoll_ctl(_epoll.get(), EPOLL_CTL_DEL, _socket.get(), nullptr);
}

// The connection's thread is not woken for answers that a waiting thread reads itself.
void DaemonConnection::updateInterest() {
  if (!_watched) return;
  std::uint32_t wanted = EPOLLRDHUP;
  if (_reader != Reader::waiter && (_calls.unwaited() > 0 || _handler)) wanted |= EPOLLIN;
  if (!_out.empty()) wanted |= EPOLLOUT;
  if (std::exchange(_interest, wanted) == wanted) return;
  epoll_event socketEvent{wanted, {}};
  socketEvent.data.fd = _socket.get();
  ::epoll_ctl(_epoll.get(), EPOLL_CTL_MOD, _socket.get(), &socketEvent);
}

}  // namespace veltrad::client
