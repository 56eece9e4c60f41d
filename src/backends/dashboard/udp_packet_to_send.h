// One datagram that waits: to be sent whole, or to be acknowledged. A plain value; any one thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace veltrad {

class UDPPacketToSend {
 public:
  enum State { notSent = 0, awaitsAcknowledgement = 1 };

  // Copies the bytes.
  UDPPacketToSend(std::string_view bytes, std::uint16_t eventNum) : _data(bytes), _eventNumber(eventNum) {}

  State state() const { return _state; }
  void setState(State state) { _state = state; }
  int numberOfChecks() const { return _numberOfChecks; }  // ticks since the last transmission
  void setNumberOfChecks(int checks) { _numberOfChecks = checks; }
  int numberOfRetransmits() const { return _numberOfRetransmits; }  // 0 to 4
  void setNumberOfRetransmits(int retransmits) { _numberOfRetransmits = retransmits; }
  std::uint16_t eventNumber() const { return _eventNumber; }
  std::string_view data() const { return _data; }

 private:
  std::string _data;
  std::uint16_t _eventNumber;
  State _state = notSent;
  int _numberOfChecks = 0;
  int _numberOfRetransmits = 0;
};

}  // namespace veltrad
