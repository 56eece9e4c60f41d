// What a session asks of the registry: storebags and its place among related sessions. Each session's own
// thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "session/aggregation.h"
#include "session/backend_set.h"

namespace veltrad::session {

class VeltradSession;

// What a session tells of itself: its family, and those who look after the device.
struct FamilyFacts {
  std::shared_ptr<Aggregation>
      aggregation;  // never null, and no other session's: the families know it by this
  std::uint32_t sessionID = 0;
  std::string sessionIDString;
  backends::SharedDictionary userInfo;         // null: none
  std::shared_ptr<const BackendSet> backends;  // null: none
  backends::SharedDictionary sessionInfo;      // null: none
};

// Where a session is in its family, as it knows itself.
struct FamilyPlace {
  const Aggregation& aggregation;
  backends::SharedDictionary userInfo;  // null: none
  std::int32_t hierarchy;
};

class VeltradSessionDelegate {
 public:
  virtual ~VeltradSessionDelegate() = default;

  // The storebag section for the session's client type, or null. May download and block for the exchange.
  virtual std::shared_ptr<const config::StorebagSection> storebagForSession(
      const VeltradSession& session) = 0;
  // Never downloads.
  virtual std::optional<std::string> storebagVersionForSession(const VeltradSession& session) = 0;

  // The families keep the facts of the last call, if the session is in one.
  virtual void sessionInfoUpdated(FamilyFacts facts) = 0;
  // The session joins the list of its user-info key, leaving any other in the same step.
  virtual void userInfoUpdatedForSession(FamilyFacts facts) = 0;
  // Gives the back ends of the session and of every session below it their combined IDs and their parents'
  // states.
  virtual void updateDownstreamSessions(FamilyFacts facts) = 0;
  // Whether an ancestor aggregates now, so that a copy is worth making.
  virtual bool ancestorAggregates(const FamilyPlace& place) = 0;
  // Queues a copy for the topmost ancestor that aggregates by now, if there is one.
  virtual CopySent sendToAncestor(const FamilyPlace& place, std::string_view copy) = 0;

  // For log lines.
  virtual std::string description() const = 0;
};

}  // namespace veltrad::session
