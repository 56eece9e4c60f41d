// SPDX-License-Identifier: Apache-2.0
// Queues copies for one client.
#include "session/aggregation.h"

#include "ipc/client_events.h"
#include "platform/log.h"

namespace veltrad::session {

Aggregation::Aggregation(std::shared_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}

void Aggregation::setActive(bool active) {
  const Lock held(_mutex);
  _active.store(active, std::memory_order_relaxed);
}

CopySent Aggregation::sendToAggregator(std::string_view copy, const std::string& session) {
  const Lock held(_mutex);
  if (!active()) return {};
  if (const auto failure = _connection->sendEvent(copy)) return {true, lineOf(*failure)};
  return {true, std::nullopt, session};
}

std::optional<std::string> Aggregation::shutdownSessionAggregation(std::uint32_t sessionID) {
  logDebug("shutdownSessionAggregation: Disable aggregation module for session %u", sessionID);
  const Lock held(_mutex);
  if (!_active.exchange(false, std::memory_order_relaxed)) return std::nullopt;
  return queue(ipc::messageToClient(std::nullopt, 0, 0, 0, std::nullopt));
}

std::optional<std::string> Aggregation::queue(std::string_view frame) {
  const auto failure = _connection->sendEvent(frame);
  return failure ? lineOf(*failure) : std::nullopt;
}

std::optional<std::string> Aggregation::lineOf(const std::string& failure) {
  return _dropLine.happened("sendMessageWithDictionary: Failed to get remote object proxy: " + failure);
}

void Aggregation::nudge() {
  const Lock held(_mutex);
  if (_connection) _connection->nudge();
}

std::optional<std::string> Aggregation::end() {
  // Possibly the last reference, released after the lock.
  std::shared_ptr<ipc::Connection> connection;
  const Lock held(_mutex);
  _active.store(false, std::memory_order_relaxed);
  connection.swap(_connection);
  return _dropLine.rest();
}

std::string aggregatedCopy(const backends::SharedDictionary& sessionInfo,
                           const backends::SharedDictionary& userInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type, const Dictionary* payload) {
  std::optional<Dictionary> merged;
  if (payload) {
    merged = *payload;
    if (userInfo) merged->merge(*userInfo);
  }
  return ipc::messageToClient(sessionInfo ? std::optional(*sessionInfo) : std::nullopt, timestamp, category,
                              type, std::move(merged));
}

}  // namespace veltrad::session
