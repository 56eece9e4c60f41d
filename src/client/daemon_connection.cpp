// SPDX-License-Identifier: Apache-2.0
// Runs the thread of a session, and lets callers wait.
#include "client/daemon_connection.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <deque>
#include <system_error>

namespace veltrad::client {

namespace {

constexpr std::chrono::seconds kClosingTimeout{2};
// Large enough for the callbacks; only pages that were touched take memory.
constexpr std::size_t kStackBytes = 4u << 20;
constexpr std::uint32_t kHangUps = EPOLLRDHUP | EPOLLHUP | EPOLLERR;

void waitForSocket(int socket) {
  pollfd watched{socket, POLLIN | POLLOUT, 0};
  ::poll(&watched, 1, -1);
}

}  // namespace

std::shared_ptr<DaemonConnection> DaemonConnection::make(ConnectionOptions options,
                                                         const std::optional<SessionChange>& description,
                                                         std::optional<DaemonSocket> connected,
                                                         std::string& error) {
  std::shared_ptr<DaemonConnection> made(
      new DaemonConnection(std::move(options), description, connected.has_value()));
  if (!made->_watch.usable()) {
    error = "The session got no descriptors: " + std::error_code(errno, std::generic_category()).message() +
            "; raise the limit on open files.";
    return nullptr;
  }
  const bool observed = made->_options.event || made->_options.state;
  Lock lock(made->_lock);
  if (connected) {
    made->_reader.restart(std::move(connected->reader), true);
    made->_exchange.adopt(std::move(connected->socket));
    made->_watch.watch(made->_exchange.socket(), made->wantedEvents());
  }
  if ((!connected || observed) && !made->startThread()) {
    error = "The session got no thread: raise the limit on tasks.";
    return nullptr;
  }
  return made;
}

DaemonConnection::DaemonConnection(ConnectionOptions options, const std::optional<SessionChange>& description,
                                   bool connected)
    : _options(std::move(options)),
      _reader(_options.path),
      _exchange(_options, connected ? Phase::open : Phase::waiting, description) {}

DaemonConnection::~DaemonConnection() {
  if (!forked()) close();
}

bool DaemonConnection::startThread() {
  return _thread.running() ||
         (_stopping != Stopping::ending && _thread.start("veltra", kStackBytes, [this] { run(); }));
}

// ---- Calls ----

veltra_status DaemonConnection::send(OutCall call, veltra_callback callback, void* context) {
  std::shared_ptr<UploadedFile> file = call.file;
  const bool needsThread = callback || file;
  Lock lock(_lock);
  if (!startThread() && needsThread) return _exchange.refuse(VELTRA_QUEUE_FULL);
  const veltra_status status = _exchange.add(std::move(call), {nullptr, callback, context, std::move(file)});
  updateWatch();
  return status;
}

Answer DaemonConnection::sendAndWait(OutCall call) {
  if (onOwnThread()) return answerOfStatus(VELTRA_WOULD_DEADLOCK);
  const bool starts = call.change && call.change->starts;
  std::shared_ptr<UploadedFile> file = call.file;
  Waiter waiter;
  const auto deadline = Clock::now() + _options.patience;
  {
    Lock lock(_lock);
    if (starts) startThread();  // a started session comes back by itself
    const veltra_status status = _exchange.add(std::move(call), {&waiter, nullptr, nullptr, std::move(file)});
    if (status != VELTRA_OK) return answerOfStatus(status);
    // A caller that can read at once need not have the thread watch for its answer.
    if (_exchange.phase() != Phase::open || _role.holder() != ReaderRole::Holder::nobody) updateWatch();
  }
  for (Turn turn = waitForTurn(waiter, deadline); turn.reads; turn = waitForTurn(waiter, deadline))
    readUntilAnswered(waiter, turn);
  return std::move(waiter.answer);
}

// Waits until the answer has arrived, or until the caller gets the reader's role.
DaemonConnection::Turn DaemonConnection::waitForTurn(Waiter& waiter, Clock::time_point deadline) {
  Lock lock(_lock);
  while (!waiter.answer) {
    const bool open = _exchange.phase() == Phase::open;
    if (open && _role.take(ReaderRole::Holder::waiter)) {
      updateWatch();
      return {true, _exchange.socket(), _exchange.writing()};
    }
    _role.park(waiter);
    if (open || _exchange.phase() == Phase::starting) {
      waiter.changed.wait(_lock);
    } else if (!waiter.changed.waitUntil(_lock, deadline) && !waiter.answer) {
      _exchange.withdraw(waiter);
    }
    _role.unpark(waiter);
  }
  // Another one that waits may be the next to read.
  if (_role.holder() == ReaderRole::Holder::nobody) passOnReading();
  return {false};
}

void DaemonConnection::readUntilAnswered(const Waiter& waiter, Turn turn) {
  while (turn.reads) {
    // This call may still wait to be written, while the connection's thread is inside a callback.
    if (turn.writing) waitForSocket(turn.socket);
    // Blocking in recv() saves the call of poll().
    const AnswerReader::Got got = _reader.receive(turn.socket, turn.writing ? MSG_DONTWAIT : 0);
    Lock lock(_lock);
    handle(got);
    if (turn.writing) _exchange.writeWaiting();
    turn = {!waiter.answer && _exchange.phase() == Phase::open, _exchange.socket(), _exchange.writing()};
    if (!turn.reads) passOnReading();
  }
}

// ---- Reading ----

// Handles what the holder of the role has received.
void DaemonConnection::handle(AnswerReader::Got got) {
  const bool idle = !_exchange.calls().anyReady();
  _exchange.take(_reader.arrived());
  if (got == AnswerReader::Got::end || got == AnswerReader::Got::reset) {
    _watch.forget();
    _hungUp = false;
    _exchange.ended(got == AnswerReader::Got::reset);
    _role.wakeAll();  // those whose calls were not written wait for the next connection
    if (_exchange.phase() == Phase::waiting && startThread() && !onOwnThread()) _watch.wake();
  }
  if (idle && _exchange.calls().anyReady() && !onOwnThread()) _watch.wake();
  if (_stopping != Stopping::no) _progress.notifyAll();
}

void DaemonConnection::passOnReading() {
  _role.release();
  if (!_exchange.connected()) return;
  if (_exchange.phase() == Phase::open && _role.wakeOne()) return;
  if (_hungUp) {
    _watch.wake();
  } else {
    updateWatch();
  }
}

// The connection's thread is not woken for answers that a waiting thread reads itself.
std::uint32_t DaemonConnection::wantedEvents() {
  std::uint32_t wanted = EPOLLRDHUP;
  if (_role.holder() != ReaderRole::Holder::waiter && _exchange.expectsFrames()) wanted |= EPOLLIN;
  if (_exchange.writing()) wanted |= EPOLLOUT;
  return wanted;
}

void DaemonConnection::updateWatch() {
  _watch.setEvents(wantedEvents());
}

// ---- The connection's thread ----

void DaemonConnection::run() {
  _ownThread.store(std::this_thread::get_id(), std::memory_order_relaxed);
  std::uint32_t events = EPOLLIN;  // frames may have followed the hello
  for (;;) {
    connectIfDue();
    serve(events);
    if (!runReady()) return;
    events = _watch.wait(millisecondsToNextStep());
  }
}

void DaemonConnection::connectIfDue() {
  {
    Lock lock(_lock);
    if (_exchange.phase() != Phase::waiting || !_exchange.wish().due(Clock::now())) return;
  }
  auto socket = connectAtOnce(_options.path);
  Lock lock(_lock);
  if (_exchange.phase() != Phase::waiting) return;
  if (!socket) return _exchange.attemptFailed(socket.error().text);
  _reader.restart({}, false);
  _exchange.attempted(std::move(socket).value());
  _watch.watch(_exchange.socket(), wantedEvents());
}

void DaemonConnection::serve(std::uint32_t events) {
  const int socket = socketToRead(events);
  for (bool goesOn = socket >= 0; goesOn;) {
    AnswerReader::Got got = _reader.receive(socket, MSG_DONTWAIT);
    Lock lock(_lock);
    if (_hungUp && got == AnswerReader::Got::nothing) got = AnswerReader::Got::end;
    handle(got);
    goesOn = _hungUp && _exchange.connected();
    if (!goesOn) passOnReading();
  }
}

// -1 if there is nothing to read, or another thread reads.
int DaemonConnection::socketToRead(std::uint32_t events) {
  Lock lock(_lock);
  if (!_exchange.connected()) return -1;
  if (_exchange.phase() == Phase::greeting && _exchange.wish().due(Clock::now())) {
    _watch.forget();
    _exchange.greetingFailed();
    return -1;
  }
  if (events & EPOLLOUT) _exchange.writeWaiting();
  if (events & kHangUps) {
    _hungUp = true;
    _watch.forget();  // or epoll would report it again and again while a waiting thread reads
  }
  if (((events & EPOLLIN) || _hungUp) && _role.take(ReaderRole::Holder::ownThread)) return _exchange.socket();
  updateWatch();
  return -1;
}

int DaemonConnection::millisecondsToNextStep() {
  Lock lock(_lock);
  const auto next = _exchange.wish().nextStep();
  if (!next) return -1;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(*next - Clock::now()).count();
  return static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
}

// False if the thread is to end: the connection is closed, or a callback has forked and this is the child.
bool DaemonConnection::runReady() {
  std::deque<CallTable::Ready> batch;
  {
    Lock lock(_lock);
    _exchange.calls().takeReady(batch);
  }
  for (CallTable::Ready& item : batch) {
    if (item.answer) {
      settleUpload(*item.answer);
      if (item.callback) item.callback(item.context, item.answer.get());
    } else if (item.change) {
      _options.state(*item.change);
    } else {
      _options.event(item.event);
    }
    if (forked()) return false;
  }
  Lock lock(_lock);
  return _stopping != Stopping::ending || _exchange.calls().anyReady();
}

// ---- The end ----

std::uint64_t DaemonConnection::close() {
  const auto deadline = Clock::now() + kClosingTimeout;
  {
    Lock lock(_lock);
    if (_stopping == Stopping::ending) return 0;
    _stopping = Stopping::draining;
    _exchange.beginClosing();
    if (!_exchange.drained() && startThread()) {
      updateWatch();
      _watch.wake();
      while (!_exchange.drained() && _progress.waitUntil(_lock, deadline)) {
      }
    }
    _exchange.finish();
    _role.wakeAll();
    _stopping = Stopping::ending;
    _watch.wake();
  }
  joinThread();
  Lock lock(_lock);
  return _exchange.untoldLoss();
}

// Nobody starts or joins it any more.
void DaemonConnection::joinThread() {
  _thread.join();
}

void DaemonConnection::abandon(std::shared_ptr<DaemonConnection> connection) {
  connection->closeCopies();
  if (!connection->mayFree()) (void)new std::shared_ptr<DaemonConnection>(std::move(connection));
}

// The child alone has this copy of the object, and one thread.
void DaemonConnection::closeCopies() {
  _thread.forget();
  _watch.abandon();
  _exchange.abandon();
}

// False if the fork came while a thread of the parent was changing the object.
bool DaemonConnection::mayFree() {
  if (!_lock.tryLock()) return false;
  const bool unread = _role.holder() == ReaderRole::Holder::nobody;
  _lock.unlock();
  return unread;
}

veltra_statistics DaemonConnection::statistics() {
  Lock lock(_lock);
  return _exchange.statistics();
}

std::uint64_t DaemonConnection::counter(veltra_counter which) {
  Lock lock(_lock);
  return _exchange.counter(which);
}

}  // namespace veltrad::client
