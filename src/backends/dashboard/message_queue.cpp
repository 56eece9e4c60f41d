// Sending, waiting, sending again, giving up.
#include "backends/dashboard/message_queue.h"

#include <algorithm>
#include <iterator>

namespace veltrad::backends {

namespace {
// Ticks before a retransmission, by the retransmissions done so far.
constexpr int checksBeforeRetransmit[] = {2, 3, 5, 9};
constexpr int kMostRetransmits = static_cast<int>(std::size(checksBeforeRetransmit));
static_assert(checksBeforeRetransmit[kMostRetransmits - 1] == SentCopies::kTicks);
// Five transmissions of each that waits, and as many again of those that have gone.
constexpr std::size_t kMostCopies = MessageQueue::maxPendingSharedPackets * 2 * (kMostRetransmits + 1);
}  // namespace

MessageQueue::MessageQueue(bool reliableUDP, bool shared, Send send)
    : _reliableUDP(reliableUDP),
      _most(shared ? maxPendingSharedPackets : maxPendingPackets),
      _send(std::move(send)) {
  if (shared) _copies.emplace(kMostCopies);
}

MessageQueue::First MessageQueue::tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                                               std::optional<platform::Charge> charge) {
  const bool sent = _send(datagram);
  First result{sent ? wire::Reason::datagram_sent : wire::Reason::datagram_held, std::nullopt};
  if (sent && !_reliableUDP) return result;
  if (!charge)
    return {sent ? wire::Reason::no_memory_to_await : wire::Reason::no_memory_to_hold, std::nullopt};
  auto& record = _pending.emplace_back(datagram, eventNumber, ++_lastSerial, std::move(*charge));
  if (sent) {
    record.setState(UDPPacketToSend::awaitsAcknowledgement);
    if (_copies) _copies->sent(record.serial(), eventNumber);
  }
  if (_pending.size() > _most) {
    _pending.pop_front();
    result.pushedOut = _copies ? wire::Reason::shared_datagrams_wait : wire::Reason::datagrams_wait;
  }
  return result;
}

MessageQueue::Tick MessageQueue::tick() {
  Tick result;
  if (_copies) _copies->tick();
  for (auto record = _pending.begin(); record != _pending.end();) {
    record = check(*record, result) ? _pending.erase(record) : std::next(record);
  }
  return result;
}

bool MessageQueue::send(const UDPPacketToSend& record) {
  if (!_send(record.data())) return false;
  if (_copies && _reliableUDP) _copies->sent(record.serial(), record.eventNumber());
  return true;
}

bool MessageQueue::check(UDPPacketToSend& record, Tick& result) {
  if (record.state() == UDPPacketToSend::awaitsAcknowledgement) return checkAcknowledgement(record, result);
  if (!send(record)) return false;
  ++result.sent;
  record.setState(UDPPacketToSend::awaitsAcknowledgement);
  return !_reliableUDP;
}

bool MessageQueue::checkAcknowledgement(UDPPacketToSend& record, Tick& result) {
  const int retransmits = record.numberOfRetransmits();
  if (retransmits >= kMostRetransmits) {
    ++result.givenUp;
    return true;
  }
  const int checks = record.numberOfChecks() + 1;
  if (checks < checksBeforeRetransmit[retransmits]) {
    record.setNumberOfChecks(checks);
  } else if (send(record)) {
    record.setNumberOfChecks(0);
    record.setNumberOfRetransmits(retransmits + 1);
    ++result.sentAgain;
  }
  return false;
}

std::size_t MessageQueue::notSent() const {
  return static_cast<std::size_t>(std::count_if(
      _pending.begin(), _pending.end(),
      [](const UDPPacketToSend& record) { return record.state() == UDPPacketToSend::notSent; }));
}

bool MessageQueue::acknowledge(std::uint16_t eventNumber) {
  const auto answered = _copies ? _copies->answered(eventNumber) : std::nullopt;
  const auto record = std::find_if(_pending.begin(), _pending.end(), [&](const UDPPacketToSend& one) {
    return _copies ? answered == one.serial() : one.eventNumber() == eventNumber;
  });
  if (record == _pending.end()) return false;
  _pending.erase(record);
  return true;
}

}  // namespace veltrad::backends
