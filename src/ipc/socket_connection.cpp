// SPDX-License-Identifier: Apache-2.0
// Receives frames, runs their calls and ends the connection.
#include "ipc/socket_connection.h"

#include <fmt/format.h>
#include <poll.h>

#include <algorithm>
#include <cerrno>
#include <new>

#include "base/version.h"
#include "ipc/client_events.h"
#include "ipc/dispatcher.h"
#include "platform/log.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace key = wire::key;

namespace {

using Clock = std::chrono::steady_clock;

// The time for writing what still waits when a connection ends.
constexpr std::chrono::seconds kLastWrites{1};
// The wait while unfinished frames take all memory that the user may use for them: most of them end soon,
// some never.
constexpr std::chrono::seconds kLongestWaitForFrames{2};
// Bounds the time for which answers wait for those of calls that came with theirs.
constexpr std::size_t kMostHeldBytes = 4096;
// In milliseconds.
constexpr int kNewsAgain = 1000;
constexpr int kWithoutEnd = -1;

}  // namespace

std::string refusalFrame(const std::string& description) {
  return wire::makeFrame(wire::FrameKind::refusal, 0,
                         {{key::kError, wire::dictionaryOfError(wire::makeReportingError(description, -1))}});
}

std::string SocketConnection::describe(std::uint64_t number, const Peer& peer) {
  return fmt::format("connection {} (uid {}, pid {})", number, peer.uid, peer.pid);
}

SocketConnection::SocketConnection(std::uint64_t number, FileDescriptor socket, Peer peer,
                                   Entitlements& entitlements, platform::LentFiles& lentFiles,
                                   platform::Counters& counters,
                                   std::shared_ptr<platform::MemoryAccount> account)
    : _out(std::make_shared<OutQueue>(std::move(socket), counters, account)),
      _peer(std::move(peer)),
      _description(describe(number, _peer)),
      _account(std::move(account)),
      _entitlements(entitlements),
      _lentFiles(lentFiles),
      _counters(counters),
      _reader(_account) {}

std::optional<Value> SocketConnection::valueForEntitlement(std::string_view name) {
  return _entitlements.valueForEntitlement(name, _peer);
}

std::optional<std::string> SocketConnection::sendEvent(std::string_view frame) {
  return ipc::sendEvent(*_out, frame);
}

void SocketConnection::nudge() {
  _nudged.store(true, std::memory_order_release);
  _out->wakeReader();
}

// Without memory it is tried again before the next call, and within kNewsAgain.
void SocketConnection::takeNews() {
  if (!_nudged.load(std::memory_order_relaxed) || !_session) return;
  _nudged.exchange(false, std::memory_order_acquire);
  try {
    _session->takeNews();
  } catch (const std::bad_alloc&) {
    _nudged.store(true, std::memory_order_relaxed);
  }
}

void SocketConnection::run() {
  // A delegate that accepted without resume(), a session or an observer has nothing that could serve the
  // client.
  try {
    if (_resumed && (_session || _observer)) serve();
  } catch (const std::bad_alloc&) {
    _counters.count(wire::Reason::call_out_of_memory);
  }
  end();
}

void SocketConnection::refuse(const std::string& description) {
  _session.reset();
  _interruptionHandler = nullptr;
  _invalidationHandler = nullptr;
  _out->sendReply(refusalFrame(description));
  _out->close();
}

void SocketConnection::stop(Clock::time_point deadline) {
  _deadline.store(deadline.time_since_epoch().count(), std::memory_order_relaxed);
  _stopping.store(true, std::memory_order_release);
  _out->stopReading();
}

bool SocketConnection::overdue() const {
  return _stopping.load(std::memory_order_acquire) &&
         Clock::now().time_since_epoch().count() >= _deadline.load(std::memory_order_relaxed);
}

void SocketConnection::serve() {
  while (runFrames() && !_ended) {
    if (!receive()) return;
  }
}

// Runs all frames that have arrived, unless the client must first read what waits for it. False if the
// connection must end.
bool SocketConnection::runFrames() {
  wire::Frame frame;
  while (!_out->endRequested() && !overdue()) {
    takeNews();
    if (_out->waitingBytes() > kOutQueueHighWater && !_stopping.load(std::memory_order_acquire)) {
      waitForClientToRead();
      continue;
    }
    switch (_reader.next(frame)) {
      case wire::FrameReader::Next::frame:
        // The answers of calls that came together go together.
        if (_reader.frameWaits()) _out->hold();
        if (!runFrame(frame)) return false;
        if (_out->waitingBytes() > kMostHeldBytes) _out->flush();
        break;
      case wire::FrameReader::Next::impossible:
        return violation(
            fmt::format("A frame of {} bytes with {} descriptors is impossible: at most {} and 1.",
                        frame.header.bodyLength, frame.header.descriptors, frame.header.bodyLimit()));
      case wire::FrameReader::Next::needMore:
        if (_reader.strayDescriptors()) return violation("A descriptor came that no frame announced.");
        return true;
    }
  }
  return false;
}

// Receives more bytes, or their end. False if the connection must end.
bool SocketConnection::receive() {
  while (true) {
    if (_reader.moreLikely()) {
      _out->flush();
    } else {
      waitForBytes();
    }
    takeNews();
    if (_out->endRequested() || overdue()) return false;
    switch (_reader.receive(_out->socket())) {
      case SocketReader::Got::bytes:
        _lackingRoomSince.reset();
        return true;
      case SocketReader::Got::nothing:
        break;
      case SocketReader::Got::end:
        _ended = true;
        return true;
      case SocketReader::Got::badDescriptors:
        return violation("More descriptors came than a frame can carry.");
      case SocketReader::Got::noRoom:
        if (!waitForRoom()) {
          return endWith(wire::Reason::unfinished_frames,
                         "Too many bytes of unfinished frames wait in the daemon; try again later.");
        }
    }
  }
}

// Waits for memory, since all but unfinished frames of the user will release theirs. False if it has waited
// too long.
bool SocketConnection::waitForRoom() {
  const auto now = Clock::now();
  if (!_lackingRoomSince) _lackingRoomSince = now;
  const auto longest = _reader.hopeless() ? kLongestWaitForFrames : kLongestWaitForMemory;
  if (now - *_lackingRoomSince > longest) return false;
  poll(0, 100);
  return true;
}

// Waits until the client has read enough, or for a wake-up. Frames may wait in the reader, so it does not
// wait for bytes to read.
void SocketConnection::waitForClientToRead() {
  if (_out->flush() > kOutQueueHighWater) poll(POLLOUT);
}

// Waits until the client has sent something, for room to write what waits, or for a wake-up.
void SocketConnection::waitForBytes() {
  _reader.rest();
  const bool newsWait = _nudged.load(std::memory_order_relaxed);
  poll(_out->flush() > 0 ? POLLIN | POLLOUT : POLLIN, newsWait ? kNewsAgain : kWithoutEnd);
}

void SocketConnection::poll(short events, int milliseconds) {
  pollfd watched[] = {{_out->socket(), events, 0}, {_out->wakeUp(), POLLIN, 0}};
  if (::poll(watched, 2, milliseconds) > 0 && watched[1].revents != 0) _out->drainWakeUp();
}

bool SocketConnection::runFrame(const wire::Frame& frame) {
  FileDescriptor lent;
  if (frame.header.descriptors == 1) {
    auto came = _reader.takeDescriptor();
    if (!came) return violation("A frame announced a descriptor, and none came.");
    lent = std::move(*came);
  }
  try {
    if (!_greeted) return greet(frame);
    ++_calls;
    if (const auto why = runCall(frame, std::move(lent))) interrupted(*why);
  } catch (const std::bad_alloc&) {
    // The destructor of the call's PendingReply has sent an error.
    _counters.count(wire::Reason::call_out_of_memory);
  }
  return true;
}

// The descriptor is lent for the duration of the call. A request to remove the file precedes the call's
// reply.
std::optional<std::string> SocketConnection::runCall(const wire::Frame& frame, FileDescriptor lent) {
  if (!lent.isOpen()) return dispatch(frame);
  const auto loan = _lentFiles.lend(std::move(lent), _peer.pid, [out = _out, callID = frame.header.callID] {
    return callID != 0 && sendRemoveUploadedFile(*out, callID);
  });
  return dispatch(frame, loan.token());
}

std::optional<std::string> SocketConnection::dispatch(const wire::Frame& frame,
                                                      const std::string& extensionToken) {
  const bool large = frame.header.kind == wire::FrameKind::largeCall;
  CallMemory memory{_account, large ? _reader.takeLargeCharge() : platform::Charge(), _counters,
                    [this] { _out->flush(); }, [this] { return overdue(); }};
  auto refusal = _observer ? dispatchQuestion(frame, *_observer, _out, memory)
                           : dispatchCall(frame, *_session, _out, memory, extensionToken);
  if (large) _reader.rest();  // its buffer is part of what the call was charged
  return refusal;
}

bool SocketConnection::greet(const wire::Frame& frame) {
  if (frame.header.kind != wire::FrameKind::hello) {
    return violation(fmt::format("The first frame must be a hello (kind 1), not of kind {}.",
                                 static_cast<unsigned>(frame.header.kind)));
  }
  const auto body = decodeFrameBody(frame);
  if (!body) return violation(fmt::format("The hello cannot be read: {}.", body.error()));
  const Value* stated = body.value().find(key::kWire);
  const auto wire = stated ? stated->toInt64() : std::nullopt;
  if (!wire) return violation("The hello cannot be read: \"wire\" must be a number.");
  if (*wire != wire::kWireVersion) {
    return violation(fmt::format("The client speaks wire version {}, the daemon speaks version {}.", *wire,
                                 wire::kWireVersion));
  }
  _greeted = true;
  _out->sendReply(wire::makeFrame(wire::FrameKind::hello, 0,
                                  {{key::kWire, wire::kWireVersion}, {key::kDaemon, kVersion}}));
  return true;
}

void SocketConnection::interrupted(const std::string& why) {
  _counters.count(wire::Reason::call_unreadable);
  logDebug("connection: %s sent a call that cannot be read: %s", _description.c_str(), why.c_str());
  if (_interruptionHandler) _interruptionHandler();
}

bool SocketConnection::violation(const std::string& description) {
  return endWith(wire::Reason::protocol_broken, description);
}

// Tells the client why the connection ends.
bool SocketConnection::endWith(wire::Reason counted, const std::string& description) {
  _counters.count(counted);
  logDebug("connection: %s ends: %s", _description.c_str(), description.c_str());
  _out->sendReply(refusalFrame(description));
  return false;
}

void SocketConnection::end() {
  if (const auto handler = std::exchange(_invalidationHandler, nullptr)) handler();
  _interruptionHandler = nullptr;
  _observer.reset();
  // Before the session's end, so that the client knows what the end of its copies means.
  if (_greeted && _stopping.load(std::memory_order_acquire)) sendGoodbye(*_out, _calls);
  if (const auto session = std::exchange(_session, nullptr)) session->end();
  writeRest();
  _out->close();
}

void SocketConnection::writeRest() {
  const auto last = Clock::now() + kLastWrites;
  while (_out->flush() > 0 && !_out->endRequested() && !overdue()) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(last - Clock::now()).count();
    if (left <= 0) return;
    pollfd watched{_out->socket(), POLLOUT, 0};
    ::poll(&watched, 1, static_cast<int>(std::min<long>(left, 100)));
  }
}

}  // namespace veltrad::ipc
