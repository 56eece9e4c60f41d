// What the client exports to the daemon: copies of messages for its aggregation callback. Any thread.
#pragma once

#include <cstdint>
#include <optional>

#include "base/value.h"

namespace veltrad::wire {

class ClientSessionReplyInterface {
 public:
  virtual ~ClientSessionReplyInterface() = default;
  // No answer is awaited. `timestamp` in seconds since 1970. Everything empty or zero: the end of
  // aggregation.
  virtual void sendMessageToClient(std::optional<Dictionary> sessionInfo, double timestamp,
                                   std::uint16_t category, std::uint16_t type,
                                   std::optional<Dictionary> payload) = 0;
};

}  // namespace veltrad::wire
