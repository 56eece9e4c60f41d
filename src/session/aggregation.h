// SPDX-License-Identifier: Apache-2.0
// Aggregation: sends one session's client copies of its messages and of those of the sessions below it.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/backend.h"
#include "ipc/connection.h"
#include "platform/limited_line.h"
#include "session/lock_ranks.h"

namespace veltrad::session {

struct CopySent {
  // The session aggregates, so no other session gets the copy.
  bool taken = false;
  // A log line if the copy was lost. Logged after all locks are released.
  std::optional<std::string> line;
  // The session whose client gets it; empty: it was lost.
  std::string to = {};
};

// Each session shares one with the families. Any thread. Copies and the end mark are queued under its lock,
// so that no copy follows the mark. The lines that it returns are logged after all locks are released.
class Aggregation {
 public:
  explicit Aggregation(std::shared_ptr<ipc::Connection> connection);

  bool active() const { return _active.load(std::memory_order_relaxed); }
  void setActive(bool active);
  // Queues a frame of aggregatedCopy(). Does not block.
  // `session`: its ID.
  CopySent sendToAggregator(std::string_view copy, const std::string& session);
  // Stops aggregating. If it was active, tells the client that no more copies follow.
  [[nodiscard]] std::optional<std::string> shutdownSessionAggregation(std::uint32_t sessionID);
  // Makes the session's own thread call takeNews().
  void nudge();
  // Releases the connection.
  [[nodiscard]] std::optional<std::string> end();

 private:
  std::optional<std::string> queue(std::string_view frame) REQUIRES(_mutex);
  std::optional<std::string> lineOf(const std::string& failure) REQUIRES(_mutex);

  // Written under the lock.
  std::atomic<bool> _active{false};
  platform::LimitedLine _dropLine{"copies"};

  Mutex _mutex SESSION_LOCK;
  std::shared_ptr<ipc::Connection> _connection GUARDED_BY(_mutex);
};

// The frame for an aggregating client: the message with the sender's user info added to its payload.
std::string aggregatedCopy(const backends::SharedDictionary& sessionInfo,
                           const backends::SharedDictionary& userInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type, const Dictionary* payload);

}  // namespace veltrad::session
