// SPDX-License-Identifier: Apache-2.0
// Handles calls, answers, and the begin and end of connections.
#include "client/exchange.h"

#include <sys/random.h>
#include <sys/socket.h>
#include <time.h>

#include <cstdint>

#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::client {

namespace key = wire::key;

namespace {

constexpr const char* kConnectionEnded = "The connection to the daemon ended before the answer came.";
constexpr unsigned kAddedWithoutTrying = 8;
constexpr const char* kNoWords = "The daemon has ended the connection.";
constexpr const char* kStopped = "The daemon has stopped.";

void setCallID(std::string& frame, std::uint32_t callID) {
  wire::FrameHeader header = wire::decodeFrameHeader(frame.data());
  header.callID = callID;
  wire::encodeFrameHeader(header, frame.data());
}

// From 0 to 1.
double draw() {
  std::uint32_t bits = 0;
  if (::getrandom(&bits, sizeof bits, GRND_NONBLOCK) != sizeof bits) return 0.5;
  return static_cast<double>(bits) / UINT32_MAX;
}

// Precise to a few milliseconds, and cheaper than the precise clock.
WrittenCalls::TimePoint coarseNow() {
  timespec now{};
  ::clock_gettime(CLOCK_MONOTONIC_COARSE, &now);
  return WrittenCalls::TimePoint(std::chrono::seconds(now.tv_sec) + std::chrono::nanoseconds(now.tv_nsec));
}

Dictionary argumentsOf(const Dictionary& event) {
  const Dictionary* arguments = event.dictionary(key::kArguments);
  return arguments ? *arguments : Dictionary{};
}

// The copy that says that no more follow.
bool isEndMark(const Dictionary& event) {
  const std::string* operation = event.string(key::kOperation);
  const Dictionary arguments = argumentsOf(event);
  return operation && *operation == wire::event::kSendMessageToClient &&
         !arguments.contains(key::kSessionInfo) && !arguments.contains(key::kPayload) &&
         arguments.real(key::kTimestamp).value_or(0) == 0;
}

}  // namespace

Exchange::Exchange(const ConnectionOptions& options, Phase first,
                   const std::optional<SessionChange>& description)
    : _options(options), _out(options.queueBytes, _record), _wish(first, options.patience) {
  if (description) _record.standing().apply(*description);
}

// ---- Connections ----

void Exchange::adopt(FileDescriptor socket) {
  _socket = std::move(socket);
  if (_record.standing().described()) _record.calls().add(0, false);
  _out.connect(_socket.get(), {});
  ++_connections;
  tell(VELTRA_STATE_CONNECTED);
  _out.release();
}

void Exchange::attempted(FileDescriptor socket) {
  const SessionDescription& standing = _record.standing();
  _socket = std::move(socket);
  _wish.attempted(Reconnection::Clock::now());
  if (standing.described()) _record.calls().add(0, false);
  if (standing.started()) {
    _startID = _calls.takeID();
    _record.calls().add(_startID, false);
  }
  _out.connect(_socket.get(), helloFrame() + standing.firstCalls(_startID));
  _out.writeWaiting();
}

void Exchange::attemptFailed(const std::string& why) {
  _wish.ended(Reconnection::Clock::now(), draw());
  tell(VELTRA_STATE_CONNECTING, why.c_str());
}

void Exchange::greetingFailed() {
  disconnect(unansweredGreeting(_options.path, _options.patience).text);
}

void Exchange::greeted() {
  ++_connections;
  _wish.greeted(_record.standing().started());
  tell(VELTRA_STATE_CONNECTED);
  if (phase() == Phase::open) _out.release();
  writeWaiting();
}

void Exchange::started(const veltra_reply& answer) {
  _startID = 0;
  const char* why = answer.error ? answer.error->description.c_str() : nullptr;
  tell(VELTRA_STATE_STARTED, why, ValuePointer(veltra_retain(answer.backends.get())));
  if (phase() != Phase::starting) return;
  _wish.started();
  _out.release();
  writeWaiting();
}

void Exchange::ended(bool reset) {
  if (!connected()) return;
  // After this end has closed its half, a daemon that has run everything closes the other half without a
  // frame.
  if (_closing == Closing::halfClosed && !reset && _lastWords.empty()) _record.calls().allRan();
  disconnect(_lastWords.empty() ? kNoWords : _lastWords);
}

void Exchange::disconnect(const std::string& why) {
  const bool greeted = phase() != Phase::greeting;
  _out.disconnect();
  _record.connectionEnded();
  _calls.endAllBut(_out.waitingIDs(), VELTRA_NO_REPLY, kConnectionEnded);
  _socket.reset();
  _startID = 0;
  _wish.ended(Reconnection::Clock::now(), draw());
  if (greeted) tell(VELTRA_STATE_LOST, why.c_str());
  _lastWords.clear();
  if (_record.standing().finished() || (_closing != Closing::no && _out.empty())) {
    giveUp();
  } else {
    if (_closing == Closing::halfClosed) _closing = Closing::draining;
    tell(VELTRA_STATE_CONNECTING, greeted ? nullptr : why.c_str());
  }
}

void Exchange::giveUp() {
  if (phase() == Phase::over) return;
  _wish.giveUp();
  _out.stop();
  _calls.endAllBut({}, VELTRA_NO_REPLY, kConnectionEnded);
  tell(VELTRA_STATE_CLOSED);
}

void Exchange::tell(veltra_connection_state state, const char* why, ValuePointer backends) {
  if (!_options.state) return;
  _calls.addChange({state, std::move(backends), why ? std::optional<std::string>(why) : std::nullopt});
}

// ---- Calls ----

veltra_status Exchange::add(OutCall call, CallTable::Call to) {
  // The connection's thread writes what waits, but it may be inside a callback.
  if (++_added % kAddedWithoutTrying == 0) writeWaiting();
  const bool starts = call.change && call.change->starts;
  const bool awaited = to.awaitsAnswer();
  const std::uint32_t callID =
      awaited || starts || _record.calls().shouldAsk(coarseNow()) ? _calls.takeID() : 0;
  if (callID != 0) setCallID(call.bytes, callID);
  const veltra_status status = _out.write(std::move(call));
  if (status != VELTRA_OK) return status;
  if (starts) _startID = callID;
  if (to.waiter) to.waiter->callID = callID;
  if (awaited) _calls.add(callID, std::move(to));
  return VELTRA_OK;
}

void Exchange::withdraw(Waiter& waiter) {
  if (_out.withdraw(waiter.callID)) _calls.answer(waiter.callID, answerOfStatus(VELTRA_NO_DAEMON));
}

void Exchange::writeWaiting() {
  if (!_out.empty()) _out.writeWaiting();
  closeHalf();
}

bool Exchange::expectsFrames() const {
  return phase() == Phase::greeting || phase() == Phase::starting || _calls.unwaited() > 0 ||
         _closing != Closing::no || _options.event || _record.calls().awaitsAnswer();
}

// ---- Answers and events ----

void Exchange::take(std::vector<Arrived>& arrived) {
  for (Arrived& one : arrived) {
    switch (one.kind) {
      case Arrived::Kind::greeting:
        greeted();
        break;
      case Arrived::Kind::refusal:
        _lastWords = one.failure->text;
        ::shutdown(_socket.get(), SHUT_RDWR);
        break;
      case Arrived::Kind::answer:
        takeAnswer(std::move(one));
        break;
      case Arrived::Kind::event:
        takeEvent(std::move(one.event));
    }
  }
  arrived.clear();
}

void Exchange::takeAnswer(Arrived arrived) {
  _record.calls().answered(arrived.callID);
  if (arrived.callID == _startID) started(*arrived.answer);
  _calls.answer(arrived.callID, std::move(arrived.answer));
}

void Exchange::takeEvent(Dictionary event) {
  const std::string* operation = event.string(key::kOperation);
  if (operation && *operation == wire::event::kGoodbye) {
    const Dictionary arguments = argumentsOf(event);
    const Value* calls = arguments.find(key::kCalls);
    const auto count = calls ? calls->toInt64() : std::nullopt;
    if (count && *count >= 0) _record.calls().ran(static_cast<std::uint64_t>(*count));
    _out.hold();  // nothing more is read
    _lastWords = kStopped;
  } else if (const auto callID = callToRemoveFileOf(event)) {
    _calls.askForRemoval(*callID);
  } else if (_options.event) {
    if (isEndMark(event)) {
      // A daemon that stops ends nothing for good: copies go on when the session has come back.
      if (!_lastWords.empty() && !_record.standing().finished()) return;
      _record.standing().endAggregation();
    }
    _calls.addEvent(std::move(event));
  }
}

// ---- The end ----

void Exchange::beginClosing() {
  _out.close();
  _closing = Closing::draining;
  writeWaiting();
  if (!connected() && _out.empty()) giveUp();
}

// Ends the connection's outgoing half, so that the daemon ends the other one when it has run everything.
void Exchange::closeHalf() {
  if (_closing != Closing::draining || phase() != Phase::open || !_out.empty()) return;
  if (_record.calls().uncertain() == 0) return;
  _closing = Closing::halfClosed;
  ::shutdown(_socket.get(), SHUT_WR);
}

bool Exchange::drained() const {
  return phase() == Phase::over ||
         (_out.waiting() == 0 && (!connected() || _record.calls().uncertain() == 0));
}

void Exchange::finish() {
  if (connected()) ::shutdown(_socket.get(), SHUT_RDWR);  // makes a thread that reads return
  giveUp();
}

// ---- Figures ----

veltra_statistics Exchange::statistics() const {
  veltra_statistics counts = _calls.counts();
  counts.sent = _record.sent();
  counts.queued = _out.waiting();
  counts.dropped = _out.refused() + _record.lost();
  return counts;
}

std::uint64_t Exchange::counter(veltra_counter which) {
  if (which == VELTRA_COUNTER_LOST) return _record.tellLost();
  return which == VELTRA_COUNTER_CONNECTIONS ? _connections : 0;
}

}  // namespace veltrad::client
