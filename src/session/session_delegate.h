// SPDX-License-Identifier: Apache-2.0
// The daemon's services for a session: storebags, and its place in a family.
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

// The facts of a session that its family and the control socket need.
struct FamilyFacts {
  // Never null. Identifies the session.
  std::shared_ptr<Aggregation> aggregation;
  std::uint32_t sessionID = 0;
  std::string sessionIDString;
  backends::SharedDictionary userInfo;         // null: none
  std::shared_ptr<const BackendSet> backends;  // null: none
  backends::SharedDictionary sessionInfo;      // null: none
  backends::SharedDictionary sentUserInfo;     // what of the user info the owner does not keep back
};

// A session's place in its family. The user info may be null.
struct FamilyPlace {
  const Aggregation& aggregation;
  backends::SharedDictionary userInfo;
  std::int32_t hierarchy;
};

// The current section for a session that follows its storebag.
struct StorebagNow {
  std::shared_ptr<const config::StorebagSection> section;  // null: nothing that may be used
  std::optional<std::string> version;
};

class VeltradSessionDelegate {
 public:
  virtual ~VeltradSessionDelegate() = default;

  // The storebag section for the session's client type, or null. May block for a download.
  virtual std::shared_ptr<const config::StorebagSection> storebagForSession(
      const VeltradSession& session) = 0;
  // Never downloads.
  virtual std::optional<std::string> storebagVersionForSession(const VeltradSession& session) = 0;

  // The daemon's current section for the session; absent if the session keeps its own. Never downloads.
  virtual std::optional<StorebagNow> storebagNow(const VeltradSession&) { return std::nullopt; }

  // The reason why a storebag was refused, if that is why the session has no back ends; else `why`.
  virtual wire::Reason reasonBehind(const VeltradSession&, wire::Reason why) { return why; }

  // Updates the facts of a session that is in a family.
  virtual void sessionInfoUpdated(FamilyFacts facts) = 0;
  // Moves the session to the family of its user-info key.
  virtual void userInfoUpdatedForSession(FamilyFacts facts) = 0;
  // Sets the combined IDs and the parents' states in the back ends of the session and of the sessions below
  // it.
  virtual void updateDownstreamSessions(FamilyFacts facts) = 0;
  // Whether an ancestor aggregates now.
  virtual bool ancestorAggregates(const FamilyPlace& place) = 0;
  // Queues a copy for the topmost ancestor that aggregates now, if there is one.
  virtual CopySent sendToAncestor(const FamilyPlace& place, std::string_view copy) = 0;

  virtual std::string description() const = 0;
};

}  // namespace veltrad::session
