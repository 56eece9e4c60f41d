// SPDX-License-Identifier: Apache-2.0
// A datagram that waits to be sent whole, or to be acknowledged.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "base/value.h"
#include "platform/memory_budget.h"

namespace veltrad::backends {

// The client of a datagram, as in http::Departure.
struct DatagramOwner {
  std::shared_ptr<const Dictionary> client;
  Dictionary about;
};

struct UDPPacketToSend {
  enum State { notSent = 0, awaitsAcknowledgement = 1 };

  std::string data;
  std::uint16_t eventNumber;
  // Unique in its queue.
  std::uint64_t serial;
  // Pays for the bytes.
  platform::Charge charge;
  // Its number in the record of fates.
  std::uint64_t message = 0;
  State state = notSent;
  // Ticks since the last transmission.
  int numberOfChecks = 0;
  int numberOfRetransmits = 0;
  DatagramOwner owner{};
  // In the history of what left; 0: none.
  std::uint64_t record = 0;

  int transmissions() const { return numberOfRetransmits + 1; }
};

}  // namespace veltrad::backends
