// SPDX-License-Identifier: Apache-2.0
// Sends datagrams, reads acknowledgements and stops when nothing waits.
#include "backends/dashboard/network_proc_queue.h"

#include <endian.h>

#include <cstring>
#include <new>

#include "backends/dashboard/dashboard_queues.h"
#include "backends/dashboard/reporting_packet.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
// After this many, the pool's other handlers run.
constexpr int kMostReadAtOnce = 64;
constexpr std::size_t kEventIDAt = offsetof(tagReportingPacketHeader, eventID);
// Memory of a waiting datagram besides its bytes, and of a socket with its timer and read source.
constexpr std::size_t kDatagramBytes = 512;
constexpr std::size_t kSocketBytes = 8192;

DeliverySchedule::Time now() {
  return std::chrono::steady_clock::now();
}

// The decision for the result of a first transmission.
wire::Decision decisionOf(wire::Reason first, bool reliable) {
  switch (first) {
    case wire::Reason::datagram_sent:
      return {reliable ? wire::Fate::waiting : wire::Fate::sent, wire::Reason::always};
    case wire::Reason::datagram_held:
      return {wire::Fate::waiting, first};
    case wire::Reason::no_memory_to_await:
      return {wire::Fate::sent, first};
    default:
      return {wire::Fate::dropped, first};
  }
}
}  // namespace

NetworkProcQueue::NetworkProcQueue(UDPSocket socket, std::unique_ptr<PoolTimer> timer, const Kind& kind,
                                   std::shared_ptr<platform::MemoryAccount> account,
                                   std::shared_ptr<DashboardQueues> queues, platform::Counters& counters)
    : _counters(counters),
      _kind(kind),
      _account(std::move(account)),
      _queues(std::move(queues)),
      _socket(std::move(socket)),
      _messageQueue(
          kind.reliableUDP, kind.shared,
          [this](std::string_view datagram, bool first)
              REQUIRES(_mutex) { return send(datagram, first ? 1 : 0); },
          recorder(),
          [this](std::uint64_t message, wire::Step step, wire::Reason reason) {
            note(message, step, reason);
          }),
      _schedule(now(), kind.period),
      _timer(std::move(timer)) {}

NetworkProcQueue::~NetworkProcQueue() {
  const Lock held(_mutex);
  giveUp(wire::Reason::ended_before_acknowledgement);
  _readSource.reset();  // before the socket that it watches
}

bool NetworkProcQueue::startReading(WorkPool& pool) {
  const Lock held(_mutex);
  _readSource = ReadSource::make(pool, _socket.descriptor());
  if (_readSource) awaitReading();
  return _readSource != nullptr;
}

wire::Decision NetworkProcQueue::tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                                              const DatagramOwner& owner, const wire::StepEntry& fate) {
  auto charge = chargeFor(datagram.size());
  const Lock held(_mutex);
  if (!_timer) {
    _counters.count(wire::Reason::ended_before_sent);
    _kind.pen.write(wire::Step::dropped, wire::Reason::ended_before_sent, fate);
    return {wire::Fate::dropped, wire::Reason::ended_before_sent};
  }
  const MessageQueue::First first =
      _messageQueue.tryToSendMsg(datagram, eventNumber, std::move(charge), owner, fate.message);
  noteFirst(first, fate);
  if (first.fate == wire::Reason::no_memory_to_await) _counters.count(wire::Reason::datagram_sent);
  _counters.count(first.fate);
  if (first.pushedOut) _counters.count(*first.pushedOut);
  if (!_armed && !_messageQueue.empty()) armTimer(now());
  return decisionOf(first.fate, _kind.reliableUDP);
}

void NetworkProcQueue::note(std::uint64_t message, wire::Step step, wire::Reason reason) const {
  wire::StepEntry fate;
  fate.message = message;
  fate.status = step == wire::Step::sent && _kind.reliableUDP ? 1 : 0;
  if (message != 0) _kind.pen.write(step, reason, fate);
}

// Also notes the datagram that was dropped to make room.
void NetworkProcQueue::noteFirst(const MessageQueue::First& first, wire::StepEntry fate) const {
  const wire::Decision decision = decisionOf(first.fate, _kind.reliableUDP);
  const bool held = first.fate == wire::Reason::datagram_held;
  const bool dropped = decision.fate == wire::Fate::dropped;
  // Whether its acknowledgement is awaited.
  fate.status = decision.fate == wire::Fate::waiting ? 1 : 0;
  _kind.pen.write(dropped ? wire::Step::dropped
                  : held  ? wire::Step::held
                          : wire::Step::sent,
                  first.fate, fate);
  if (!first.pushedOut) return;
  note(first.pushedOutMessage, first.pushedOutSent ? wire::Step::given_up : wire::Step::dropped,
       *first.pushedOut);
}

// Counts it for the owner's limits of a day if the socket takes it.
MessageQueue::Sending NetworkProcQueue::send(std::string_view datagram, std::uint64_t events) {
  using Sending = MessageQueue::Sending;
  config::OwnerGate* const gate = _kind.gate;
  if (gate && !gate->hasRoomForRecord()) return Sending::notTaken;
  if (gate && !gate->mayLeave(events, datagram.size())) return Sending::forbidden;
  if (_socket.send(datagram)) return Sending::done;
  if (gate) gate->didNotLeave(events, datagram.size());
  return Sending::notTaken;
}

MessageQueue::Recorder NetworkProcQueue::recorder() const {
  config::OwnerGate* const gate = _kind.gate;
  if (!gate) return {};
  const auto sent = [gate, to = _kind.address](std::string_view datagram, const DatagramOwner& owner) {
    gate->datagramLeft(to, 1, datagram.size());
    if (!gate->keepsRecords()) return std::uint64_t{0};
    return gate->record({http::Departure::Kind::datagram, to, 1, datagram.size(), owner.client, owner.about},
                        {}, datagram, nullptr);
  };
  const auto ended = [gate, to = _kind.address](std::uint64_t record, std::size_t bytes, int transmissions,
                                                const char* error) {
    if (transmissions > 1) gate->datagramLeft(to, 0, bytes * static_cast<std::size_t>(transmissions - 1));
    gate->ended(record, {0, error, transmissions});
  };
  return {sent, ended};
}

// Batched events are dropped for a datagram that will wait for its acknowledgement, but not for one that
// probably will not wait at all.
std::optional<platform::Charge> NetworkProcQueue::chargeFor(std::size_t datagram) const {
  if (!_account) return platform::Charge();
  const std::size_t bytes = datagram + kDatagramBytes;
  return _kind.reliableUDP ? _account->keep(bytes) : _account->tryCharge(bytes, platform::MemoryUse::kept);
}

bool NetworkProcQueue::join(bool alone) {
  const Lock held(_mutex);
  if (!_timer) return false;
  if (alone && _kind.reliableUDP && (_backEnds > 0 || !_messageQueue.idle())) return false;
  ++_backEnds;
  _schedule.resume();
  return true;
}

void NetworkProcQueue::cleanup() {
  {
    const Lock held(_mutex);
    if (--_backEnds > 0) return;
    if (_schedule.cleanup(!_messageQueue.empty()) == DeliverySchedule::Verdict::stop) return cleanupSources();
    if (!chargeSocket()) {
      giveUp(wire::Reason::no_memory_to_linger);
      return cleanupSources();
    }
  }
  _queues->lingers(shared_from_this(), DashboardQueues::userOf(_account.get()));
}

bool NetworkProcQueue::chargeSocket() {
  if (!_account || _socketCharge) return true;
  _socketCharge = _account->tryCharge(kSocketBytes, platform::MemoryUse::kept);
  return _socketCharge.has_value();
}

void NetworkProcQueue::end() {
  const Lock held(_mutex);
  if (_backEnds > 0 || !_timer) return;
  giveUp(wire::Reason::too_many_linger);
  cleanupSources();
}

void NetworkProcQueue::dropWaiting() {
  const Lock held(_mutex);
  _counters.count(wire::Reason::datagram_refused_by_owner, _messageQueue.size());
  noteEnd(wire::Reason::datagram_refused_by_owner, wire::Reason::datagram_refused_by_owner);
  _messageQueue.clear([this](const UDPPacketToSend& waiting) {
    if (_kind.gate) _kind.gate->receipt().add(http::Departure::Kind::datagram, waiting.owner.client, 1);
  });
}

// Notes the end of the waiting datagrams, which are given up.
void NetworkProcQueue::noteEnd(wire::Reason ofSent, wire::Reason ofNotSent) const {
  for (const UDPPacketToSend& one : _messageQueue.pending()) {
    const bool sent = one.state == UDPPacketToSend::awaitsAcknowledgement;
    note(one.message, sent ? wire::Step::given_up : wire::Step::dropped, sent ? ofSent : ofNotSent);
  }
}

// `reason` applies to the datagrams that were sent.
void NetworkProcQueue::giveUp(wire::Reason reason) {
  const std::size_t notSent = _messageQueue.notSent();
  _counters.count(wire::Reason::ended_before_sent, notSent);
  _counters.count(reason, _messageQueue.size() - notSent);
  noteEnd(reason, wire::Reason::ended_before_sent);
  _messageQueue.clear();
}

void NetworkProcQueue::armTimer(DeliverySchedule::Time time) {
  const auto next = _schedule.next(time, !_messageQueue.empty());
  _armed = false;  // also if there is no memory for it: the next datagram arms it then
  if (next) _timer->arm(*next, [self = shared_from_this()] { self->timerFired(); });
  _armed = next.has_value();
}

void NetworkProcQueue::timerFired() {
  const Lock held(_mutex);
  if (!_timer) return;
  const auto time = now();
  try {
    if (_schedule.tickIsDue(time)) myPeriodicTask(time);
  } catch (const std::bad_alloc&) {  // what there is no memory for is done at the next tick
  }
  if (_schedule.lastResortIsDue(time)) cleanupSources();
  if (_timer) armTimer(time);
}

void NetworkProcQueue::myPeriodicTask(DeliverySchedule::Time time) {
  const MessageQueue::Tick tick = _messageQueue.tick();
  _counters.count(wire::Reason::datagram_sent, tick.sent);
  _counters.count(wire::Reason::datagram_sent_again, tick.sentAgain);
  _counters.count(wire::Reason::never_acknowledged, tick.givenUp);
  _counters.count(wire::Reason::datagram_over_daily_limit, tick.forbidden);
  switch (_schedule.afterTick(time, !_messageQueue.empty())) {
    case DeliverySchedule::Verdict::stop:
      logDebug("DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
      return cleanupSources();
    case DeliverySchedule::Verdict::lastResortScheduled:
      logDebug("DashboardBackend(myPeriodicTask): scheduled last resort clean-up in %d ms.",
               static_cast<int>(DeliverySchedule::kLastResort.count()));
      return;
    case DeliverySchedule::Verdict::goOn:
      return;
  }
}

void NetworkProcQueue::awaitReading() {
  // The handler does not keep the queue alive; the back end and the armed timer do.
  _readSource->wait([weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->readable();
  });
}

void NetworkProcQueue::readable() {
  const Lock held(_mutex);
  if (!_readSource) return;
  for (int i = 0; i < kMostReadAtOnce && processSocketRead(); ++i) {
  }
  awaitReading();
}

bool NetworkProcQueue::processSocketRead() {
  char datagram[sizeof(tagReportingPacket)];
  const auto length = _socket.receive(datagram, sizeof datagram);
  if (!length) return false;
  std::uint16_t eventNumber = 0;
  if (*length < kEventIDAt + sizeof eventNumber) {
    _counters.count(wire::Reason::acknowledgement_short);
    return true;
  }
  std::memcpy(&eventNumber, datagram + kEventIDAt, sizeof eventNumber);
  const auto how = _messageQueue.acknowledge(be16toh(eventNumber));
  _counters.count(how.value_or(wire::Reason::acknowledgement_unknown));
  return true;
}

void NetworkProcQueue::cleanupSources() {
  _timer.reset();
  _armed = false;
  _readSource.reset();
  _socket.close();
  _socketCharge.reset();
}

}  // namespace veltrad::backends
