// Aggregation: the copies that one session's client gets of its own messages and of those below it.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/backend.h"
#include "platform/limited_line.h"
#include "session/lock_ranks.h"

namespace veltrad::ipc {
class Connection;
}  // namespace veltrad::ipc

namespace veltrad::session {

// What became of a copy.
struct CopySent {
  bool taken = false;               // the session aggregates, so the copy is nobody else's
  std::optional<std::string> line;  // to be logged once no lock is held: the copy was lost
};

// One for each session; the session and the families share it. Any thread. Copies and the end mark are queued
// under its lock, so that no copy follows the mark.
class Aggregation {
 public:
  explicit Aggregation(std::shared_ptr<ipc::Connection> connection);
  ~Aggregation();

  bool active() const { return _active.load(std::memory_order_relaxed); }
  void setActive(bool active);
  // Queues a frame of aggregatedCopy(), without waiting.
  CopySent sendToAggregator(std::string_view copy);
  // Tells the client that no more copies come, if any came. The line to log, once no lock is held.
  [[nodiscard]] std::optional<std::string> shutdownSessionAggregation(std::uint32_t sessionID);
  // Lets the connection go. The last line to log.
  [[nodiscard]] std::optional<std::string> end();

 private:
  std::optional<std::string> queue(std::string_view frame) REQUIRES(_mutex);

  std::atomic<bool> _active{false};  // written under the lock
  platform::LimitedLine _dropLine{"copies"};

  Mutex _mutex SESSION_LOCK;
  std::shared_ptr<ipc::Connection> _connection GUARDED_BY(_mutex);
};

// A message as an aggregating client gets it: the payload, if there is one, with the sender's user info.
std::string aggregatedCopy(const backends::SharedDictionary& sessionInfo,
                           const backends::SharedDictionary& userInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type, const Dictionary* payload);

}  // namespace veltrad::session
