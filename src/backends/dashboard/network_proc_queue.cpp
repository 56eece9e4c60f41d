// First transmissions on the session's thread; ticks and acknowledgements on the work pool.
#include "backends/dashboard/network_proc_queue.h"

#include <endian.h>

#include <cstring>

#include "backends/dashboard/reporting_packet.h"
#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad {

namespace {
constexpr std::string_view kLost = "datagram lost: its back end ended before it was sent";
constexpr int kMostReadAtOnce = 64;  // then the pool's other handlers have their turn
constexpr std::size_t kEventIDAt = offsetof(tagReportingPacketHeader, eventID);

DeliverySchedule::Time now() {
  return std::chrono::steady_clock::now();
}
}  // namespace

NetworkProcQueue::NetworkProcQueue(platform::UDPSocket socket, std::unique_ptr<platform::PoolTimer> timer,
                                   bool reliableUDP, std::chrono::milliseconds period,
                                   platform::Counters& counters)
    : _counters(counters),
      _socket(std::move(socket)),
      _messageQueue(reliableUDP,
                    [this](std::string_view datagram) REQUIRES(_mutex) { return _socket.send(datagram); }),
      _schedule(now(), period),
      _timer(std::move(timer)) {}

NetworkProcQueue::~NetworkProcQueue() {
  const Lock held(_mutex);
  const std::size_t notSent = _messageQueue.notSent();
  _counters.count(kLost, notSent);
  _counters.count("datagram given up: not acknowledged before its back end ended",
                  _messageQueue.size() - notSent);
  _readSource.reset();  // before the socket that it watches
}

bool NetworkProcQueue::startReading(platform::WorkPool& pool) {
  const Lock held(_mutex);
  _readSource = platform::ReadSource::make(pool, _socket.descriptor());
  if (_readSource) awaitReading();
  return _readSource != nullptr;
}

void NetworkProcQueue::tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber) {
  const Lock held(_mutex);
  if (!_timer) {
    _counters.count(kLost);
    return;
  }
  const MessageQueue::First first = _messageQueue.tryToSendMsg(datagram, eventNumber);
  _counters.count(first.sent ? "datagram sent" : "datagram held: the socket did not take it");
  if (first.pushedOut) _counters.count("datagram dropped: 50 later ones wait");
  if (!_armed) armTimer(now());
}

void NetworkProcQueue::cleanup() {
  const Lock held(_mutex);
  if (_schedule.cleanup(!_messageQueue.empty()) == DeliverySchedule::Verdict::stop) cleanupSources();
}

void NetworkProcQueue::armTimer(DeliverySchedule::Time time) {
  const auto next = _schedule.next(time, !_messageQueue.empty());
  _armed = next.has_value();
  if (next) _timer->arm(*next, [self = shared_from_this()] { self->timerFired(); });
}

void NetworkProcQueue::timerFired() {
  const Lock held(_mutex);
  if (!_timer) return;
  const auto time = now();
  if (_schedule.tickIsDue(time)) myPeriodicTask(time);
  if (_schedule.lastResortIsDue(time)) cleanupSources();
  if (_timer) armTimer(time);
}

void NetworkProcQueue::myPeriodicTask(DeliverySchedule::Time time) {
  const MessageQueue::Tick tick = _messageQueue.tick();
  _counters.count("datagram sent", tick.sent);
  _counters.count("datagram sent again: not acknowledged", tick.sentAgain);
  _counters.count("datagram given up: never acknowledged", tick.givenUp);
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
  // Not a reason to live on: the back end and the armed timer are.
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
    _counters.count("acknowledgement ignored: shorter than 62 bytes");
    return true;
  }
  std::memcpy(&eventNumber, datagram + kEventIDAt, sizeof eventNumber);
  const bool known = _messageQueue.acknowledge(be16toh(eventNumber));
  _counters.count(known ? "datagram acknowledged" : "acknowledgement ignored: no such datagram waits");
  return true;
}

void NetworkProcQueue::cleanupSources() {
  _timer.reset();
  _armed = false;
  _readSource.reset();
  _socket.close();
}

}  // namespace veltrad
