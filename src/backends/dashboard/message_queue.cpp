// Sending, waiting, sending again, giving up.
#include "backends/dashboard/message_queue.h"

#include <algorithm>
#include <iterator>

namespace veltrad {

namespace {
// Ticks before a retransmission, by the retransmissions done so far.
constexpr int checksBeforeRetransmit[] = {2, 3, 5, 9};
constexpr int kMostRetransmits = static_cast<int>(std::size(checksBeforeRetransmit));
}  // namespace

MessageQueue::First MessageQueue::tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber) {
  First result{_send(datagram), false};
  if (result.sent && !_reliableUDP) return result;
  _pending.emplace_back(datagram, eventNumber);
  if (result.sent) _pending.back().setState(UDPPacketToSend::awaitsAcknowledgement);
  if (_pending.size() > maxPendingPackets) {
    _pending.erase(_pending.begin());
    result.pushedOut = true;
  }
  return result;
}

MessageQueue::Tick MessageQueue::tick() {
  Tick result;
  for (auto record = _pending.begin(); record != _pending.end();) {
    record = check(*record, result) ? _pending.erase(record) : record + 1;
  }
  return result;
}

bool MessageQueue::check(UDPPacketToSend& record, Tick& result) {
  if (record.state() == UDPPacketToSend::awaitsAcknowledgement) return checkAcknowledgement(record, result);
  if (!_send(record.data())) return false;
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
  } else if (_send(record.data())) {
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
  const auto record = std::find_if(_pending.begin(), _pending.end(), [&](const UDPPacketToSend& one) {
    return one.eventNumber() == eventNumber;
  });
  if (record == _pending.end()) return false;
  _pending.erase(record);
  return true;
}

}  // namespace veltrad
