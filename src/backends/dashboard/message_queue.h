// SPDX-License-Identifier: Apache-2.0
// The datagrams that wait, and the rules for sending and removing them. Not thread-safe.
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
#include "wire/fates.h"

namespace veltrad::backends {

// A datagram that could not be sent whole waits for the next tick. With reliable UDP every other datagram
// waits for its acknowledgement; until that comes, it is sent again on the 2nd, 5th, 10th and 19th tick, and
// given up on the 20th, or when it may not be sent again.
class MessageQueue {
 public:
  // For one back end.
  static constexpr std::size_t maxPendingPackets = 50;
  // For all one-shot messages that share a socket.
  static constexpr std::size_t maxPendingSharedPackets = 1024;
  // notTaken: not all bytes were sent. forbidden: by the owner's limit for the day.
  enum class Sending { done, notTaken, forbidden };
  // `first`: it has never been sent.
  using Send = std::function<Sending(std::string_view datagram, bool first)>;
  // Called for each step of a datagram after its first transmission, or after it was held: sent, sent again,
  // given up or acknowledged.
  using Tell = std::function<void(std::uint64_t message, wire::Step step, wire::Reason reason)>;
  // Called for each datagram when it was sent first, and when no further transmission follows.
  struct Recorder {
    std::function<std::uint64_t(std::string_view datagram, const DatagramOwner& owner)> sent;
    // `record`: what `sent` returned; `bytes`: of the datagram; `error`: one line, empty: none.
    std::function<void(std::uint64_t record, std::size_t bytes, int transmissions, const char* error)> ended;
  };

  // The result of a first transmission: whether it was sent, held, forbidden, or lost for lack of memory; and
  // why the oldest datagram was dropped to make room, if it was.
  struct First {
    wire::Reason fate;
    std::optional<wire::Reason> pushedOut;
    std::uint64_t pushedOutMessage = 0;
    bool pushedOutSent = false;
  };
  // How many datagrams were sent for the first time, sent again, given up, and removed because they were
  // forbidden.
  struct Tick {
    std::size_t sent = 0;
    std::size_t sentAgain = 0;
    std::size_t givenUp = 0;
    std::size_t forbidden = 0;
  };

  // `shared`: used by one-shot messages; each has its own back end, which starts at event number 1.
  MessageQueue(
      bool reliableUDP, bool shared, Send send, Recorder recorder = {}, Tell tell = [](auto&&...) {});

  // `charge` pays for the datagram while it waits. Without a charge it cannot wait. `message`: its number in
  // the record of fates.
  First tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                     std::optional<platform::Charge> charge, const DatagramOwner& owner = {},
                     std::uint64_t message = 0);
  Tick tick();
  // Removes the oldest datagram with this number, or in a shared queue the one that SentCopies names. Returns
  // how it was acknowledged, or nothing if there is none.
  std::optional<wire::Reason> acknowledge(std::uint16_t eventNumber);
  // True if no datagram waits, and no late acknowledgement could be taken for that of the next datagram.
  bool idle() const { return _pending.empty() && (!_copies || _copies->empty()); }
  // Calls `drop` for each one that waits, and forgets it.
  void clear(const std::function<void(const UDPPacketToSend&)>& drop = {});

  bool reliableUDP() const { return _reliableUDP; }
  bool empty() const { return _pending.empty(); }
  std::size_t size() const { return _pending.size(); }
  const std::list<UDPPacketToSend>& pending() const { return _pending; }
  // How many of the waiting datagrams were never sent.
  std::size_t notSent() const;

 private:
  Sending send(const UDPPacketToSend& record);
  // These return true if the record is to be removed.
  bool check(UDPPacketToSend& record, Tick& result);
  bool checkAcknowledgement(UDPPacketToSend& record, Tick& result);
  std::uint64_t recordSent(std::string_view datagram, const DatagramOwner& owner) const;
  void recordEnd(const UDPPacketToSend& record, const char* error) const;

  const bool _reliableUDP;
  const std::size_t _most;
  const Send _send;
  const Recorder _recorder;
  const Tell _tell;
  // Oldest first.
  std::list<UDPPacketToSend> _pending;
  std::uint64_t _lastSerial = 0;
  // Only if the queue is shared.
  std::optional<SentCopies> _copies;
};

}  // namespace veltrad::backends
