// The datagrams that wait and the rules by which they leave. No time and no socket of its own; one thread at
// a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <optional>
#include <string_view>

#include "backends/dashboard/sent_copies.h"
#include "backends/dashboard/udp_packet_to_send.h"
#include "platform/memory_budget.h"
#include "wire/reasons.h"

namespace veltrad::backends {

// A datagram that could not be sent whole waits for the next tick. With reliable UDP every other one waits
// for its acknowledgement: unless it comes, the datagram is sent again on the 2nd, 5th, 10th and 19th tick
// and given up on the 20th.
class MessageQueue {
 public:
  static constexpr std::size_t maxPendingPackets = 50;          // of one back end
  static constexpr std::size_t maxPendingSharedPackets = 1024;  // of one-shot messages to one dashboard
  // True when all bytes went out.
  using Send = std::function<bool(std::string_view datagram)>;

  struct First {
    wire::Reason fate;                      // sent, held, or no memory to wait
    std::optional<wire::Reason> pushedOut;  // of the oldest, which made room
  };
  struct Tick {
    std::size_t sent = 0;  // for the first time
    std::size_t sentAgain = 0;
    std::size_t givenUp = 0;
  };

  // `shared`: by one-shot messages, each of which has a back end of its own that begins at event number 1.
  MessageQueue(bool reliableUDP, bool shared, Send send);

  // `charge` goes with the datagram as long as it waits; none: it may not wait.
  First tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                     std::optional<platform::Charge> charge);
  Tick tick();
  // Removes the oldest one of this number, where it is shared the one that SentCopies names; false: no such
  // one waits.
  bool acknowledge(std::uint16_t eventNumber);
  void clear() { _pending.clear(); }

  bool reliableUDP() const { return _reliableUDP; }
  bool empty() const { return _pending.empty(); }
  std::size_t size() const { return _pending.size(); }
  // Of those that wait, the ones that never went out.
  std::size_t notSent() const;

 private:
  bool send(const UDPPacketToSend& record);
  // True: the record leaves.
  bool check(UDPPacketToSend& record, Tick& result);
  bool checkAcknowledgement(UDPPacketToSend& record, Tick& result);

  const bool _reliableUDP;
  const std::size_t _most;
  const Send _send;
  std::list<UDPPacketToSend> _pending;  // oldest first
  std::uint64_t _lastSerial = 0;
  std::optional<SentCopies> _copies;  // where it is shared
};

}  // namespace veltrad::backends
