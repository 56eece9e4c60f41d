// The datagrams that wait and the rules by which they leave. No time and no socket of its own; one thread at
// a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string_view>
#include <vector>

#include "backends/dashboard/udp_packet_to_send.h"

namespace veltrad {

// A datagram that could not be sent whole waits for the next tick. With reliable UDP every other one waits
// for its acknowledgement: unless it comes, the datagram is sent again on the 2nd, 5th, 10th and 19th tick
// and given up on the 20th.
class MessageQueue {
 public:
  static constexpr std::size_t maxPendingPackets = 50;
  // True when all bytes went out.
  using Send = std::function<bool(std::string_view datagram)>;

  struct First {
    bool sent = false;
    bool pushedOut = false;  // the oldest of 51 was dropped
  };
  struct Tick {
    std::size_t sent = 0;  // for the first time
    std::size_t sentAgain = 0;
    std::size_t givenUp = 0;
  };

  MessageQueue(bool reliableUDP, Send send) : _reliableUDP(reliableUDP), _send(std::move(send)) {}

  First tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber);
  Tick tick();
  // Removes the oldest one of this number; false: none waits.
  bool acknowledge(std::uint16_t eventNumber);

  bool empty() const { return _pending.empty(); }
  std::size_t size() const { return _pending.size(); }
  // Of those that wait, the ones that never went out.
  std::size_t notSent() const;

 private:
  // True: the record leaves.
  bool check(UDPPacketToSend& record, Tick& result);
  bool checkAcknowledgement(UDPPacketToSend& record, Tick& result);

  const bool _reliableUDP;
  const Send _send;
  std::vector<UDPPacketToSend> _pending;  // oldest first
};

}  // namespace veltrad
