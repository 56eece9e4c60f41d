// One datagram that waits: to be sent whole, or to be acknowledged. A plain value; any one thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "platform/memory_budget.h"

namespace veltrad::backends {

class UDPPacketToSend {
 public:
  enum State { notSent = 0, awaitsAcknowledgement = 1 };

  // Copies the bytes, which `charge` pays for. `serial`: which of its queue it is.
  UDPPacketToSend(std::string_view bytes, std::uint16_t eventNum, std::uint64_t serial,
                  platform::Charge charge)
      : _data(bytes), _charge(std::move(charge)), _serial(serial), _eventNumber(eventNum) {}

  State state() const { return _state; }
  void setState(State state) { _state = state; }
  int numberOfChecks() const { return _numberOfChecks; }  // ticks since the last transmission
  void setNumberOfChecks(int checks) { _numberOfChecks = checks; }
  int numberOfRetransmits() const { return _numberOfRetransmits; }  // 0 to 4
  void setNumberOfRetransmits(int retransmits) { _numberOfRetransmits = retransmits; }
  std::uint16_t eventNumber() const { return _eventNumber; }
  std::uint64_t serial() const { return _serial; }
  std::string_view data() const { return _data; }

 private:
  const std::string _data;
  const platform::Charge _charge;
  const std::uint64_t _serial;
  const std::uint16_t _eventNumber;
  State _state = notSent;
  int _numberOfChecks = 0;
  int _numberOfRetransmits = 0;
};

}  // namespace veltrad::backends
