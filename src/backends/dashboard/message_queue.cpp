// SPDX-License-Identifier: Apache-2.0
// Sends datagrams, again where necessary, and gives them up.
#include "backends/dashboard/message_queue.h"

#include <algorithm>
#include <iterator>

namespace veltrad::backends {

namespace {
// Ticks before a retransmission, indexed by the number of retransmissions so far.
constexpr int checksBeforeRetransmit[] = {2, 3, 5, 9};
constexpr int kMostRetransmits = static_cast<int>(std::size(checksBeforeRetransmit));
static_assert(checksBeforeRetransmit[kMostRetransmits - 1] == SentCopies::kTicks);
// Room for five transmissions of each datagram that waits, and as many of those that no longer do.
constexpr const char* kNotAcknowledged = "not acknowledged";
constexpr const char* kNoMemory = "no memory to await its acknowledgement";
constexpr std::size_t kMostCopies = MessageQueue::maxPendingSharedPackets * 2 * (kMostRetransmits + 1);
}  // namespace

MessageQueue::MessageQueue(bool reliableUDP, bool shared, Send send, Recorder recorder, Tell tell)
    : _reliableUDP(reliableUDP),
      _most(shared ? maxPendingSharedPackets : maxPendingPackets),
      _send(std::move(send)),
      _recorder(std::move(recorder)),
      _tell(std::move(tell)) {
  if (shared) _copies.emplace(kMostCopies);
}

MessageQueue::First MessageQueue::tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                                               std::optional<platform::Charge> charge,
                                               const DatagramOwner& owner, std::uint64_t message) {
  const Sending sending = _send(datagram, true);
  if (sending == Sending::forbidden) return {wire::Reason::datagram_over_daily_limit, std::nullopt, 0, false};
  const bool sent = sending == Sending::done;
  const std::uint64_t record = sent ? recordSent(datagram, owner) : 0;
  First result{sent ? wire::Reason::datagram_sent : wire::Reason::datagram_held, std::nullopt, 0, false};
  const bool waits = !sent || _reliableUDP;
  if (sent && _recorder.ended && (!waits || !charge))
    _recorder.ended(record, datagram.size(), 1, waits ? kNoMemory : "");
  if (!waits) return result;
  if (!charge)
    return {sent ? wire::Reason::no_memory_to_await : wire::Reason::no_memory_to_hold, std::nullopt, 0,
            false};
  const auto state = sent ? UDPPacketToSend::awaitsAcknowledgement : UDPPacketToSend::notSent;
  _pending.push_back({std::string(datagram), eventNumber, ++_lastSerial, std::move(*charge), message, state});
  _pending.back().owner = owner;
  _pending.back().record = record;
  if (sent && _copies) _copies->sent(_lastSerial, eventNumber);
  if (_pending.size() > _most) {
    recordEnd(_pending.front(), kNotAcknowledged);
    result.pushedOutMessage = _pending.front().message;
    result.pushedOutSent = _pending.front().state == UDPPacketToSend::awaitsAcknowledgement;
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

MessageQueue::Sending MessageQueue::send(const UDPPacketToSend& record) {
  const Sending result = _send(record.data, record.state == UDPPacketToSend::notSent);
  if (result == Sending::done && _copies && _reliableUDP) _copies->sent(record.serial, record.eventNumber);
  return result;
}

bool MessageQueue::check(UDPPacketToSend& record, Tick& result) {
  if (record.state == UDPPacketToSend::awaitsAcknowledgement) return checkAcknowledgement(record, result);
  const Sending sending = send(record);
  if (sending == Sending::notTaken) return false;
  if (sending == Sending::forbidden) {
    ++result.forbidden;
    _tell(record.message, wire::Step::dropped, wire::Reason::datagram_over_daily_limit);
    return true;
  }
  ++result.sent;
  _tell(record.message, wire::Step::sent, wire::Reason::datagram_sent);
  record.state = UDPPacketToSend::awaitsAcknowledgement;
  record.record = recordSent(record.data, record.owner);
  if (!_reliableUDP) recordEnd(record, "");
  return !_reliableUDP;
}

bool MessageQueue::checkAcknowledgement(UDPPacketToSend& record, Tick& result) {
  if (record.numberOfRetransmits >= kMostRetransmits) {
    ++result.givenUp;
    _tell(record.message, wire::Step::given_up, wire::Reason::never_acknowledged);
    recordEnd(record, kNotAcknowledged);
    return true;
  }
  const int checks = record.numberOfChecks + 1;
  if (checks < checksBeforeRetransmit[record.numberOfRetransmits]) {
    record.numberOfChecks = checks;
    return false;
  }
  const Sending sending = send(record);
  if (sending == Sending::notTaken) return false;
  if (sending == Sending::forbidden) {
    ++result.forbidden;
    _tell(record.message, wire::Step::given_up, wire::Reason::datagram_over_daily_limit);
    recordEnd(record, kNotAcknowledged);
    return true;
  }
  record.numberOfChecks = 0;
  ++record.numberOfRetransmits;
  ++result.sentAgain;
  _tell(record.message, wire::Step::again, wire::Reason::datagram_sent_again);
  return false;
}

void MessageQueue::clear(const std::function<void(const UDPPacketToSend&)>& drop) {
  for (const UDPPacketToSend& record : _pending) {
    recordEnd(record, kNotAcknowledged);
    if (drop) drop(record);
  }
  _pending.clear();
}

std::uint64_t MessageQueue::recordSent(std::string_view datagram, const DatagramOwner& owner) const {
  return _recorder.sent ? _recorder.sent(datagram, owner) : 0;
}

void MessageQueue::recordEnd(const UDPPacketToSend& record, const char* error) const {
  if (_recorder.ended && record.state != UDPPacketToSend::notSent)
    _recorder.ended(record.record, record.data.size(), record.transmissions(), error);
}

std::size_t MessageQueue::notSent() const {
  return static_cast<std::size_t>(
      std::count_if(_pending.begin(), _pending.end(),
                    [](const UDPPacketToSend& record) { return record.state == UDPPacketToSend::notSent; }));
}

std::optional<wire::Reason> MessageQueue::acknowledge(std::uint16_t eventNumber) {
  const auto answered = _copies ? _copies->answered(eventNumber) : std::nullopt;
  const auto record = std::find_if(_pending.begin(), _pending.end(), [&](const UDPPacketToSend& one) {
    return _copies ? answered && answered->datagram == one.serial : one.eventNumber == eventNumber;
  });
  if (record == _pending.end()) return std::nullopt;
  const auto how = answered && !answered->certain ? wire::Reason::acknowledged_by_number
                                                  : wire::Reason::datagram_acknowledged;
  _tell(record->message, wire::Step::acknowledged, how);
  recordEnd(*record, "");
  _pending.erase(record);
  return how;
}

}  // namespace veltrad::backends
