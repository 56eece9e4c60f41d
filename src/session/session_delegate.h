// What a session asks of the registry: storebags and its place among related sessions. Each session's own
// thread.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace veltrad::config {
struct StorebagSection;
}  // namespace veltrad::config

namespace veltrad::session {

class VeltradSession;

class VeltradSessionDelegate {
 public:
  virtual ~VeltradSessionDelegate() = default;

  // The storebag section for the session's client type, or null. May download and block for the exchange.
  virtual std::shared_ptr<const config::StorebagSection> storebagForSession(
      const VeltradSession& session) = 0;
  // Never downloads.
  virtual std::optional<std::string> storebagVersionForSession(const VeltradSession& session) = 0;
  // Runs `change` under the registry's lock: a session that changes its user info and joins another list in
  // it is never seen between two.
  virtual void changeIdentity(const std::function<void()>& change) = 0;
  // The session joins the list of its user-info key, leaving any other.
  virtual void userInfoUpdatedForSession(const std::shared_ptr<VeltradSession>& session) = 0;
  // The ID strings of the session's ancestors from the root to its parent, joined by "."; from the gap on
  // where one is missing; none for a root and where the parent is missing.
  virtual std::optional<std::string> parentSessionIDStringForSession(const VeltradSession& session) = 0;
  // The first session of the same key that is one level up. Only inside updateDownstreamSessions, which holds
  // the registry's lock.
  virtual std::shared_ptr<VeltradSession> parentSessionForChild(const VeltradSession& session) = 0;
  // Calls `use` with the topmost ancestor that aggregates, under the registry's lock, so that it stays what
  // it is; false, and no call, when there is none. `use` never blocks.
  virtual bool withAncestorAggregator(const VeltradSession& session,
                                      const std::function<void(VeltradSession&)>& use) = 0;
  // Refreshes the session and every session below it.
  virtual void updateDownstreamSessions(const std::shared_ptr<VeltradSession>& session) = 0;
  // For log lines.
  virtual std::string description() const = 0;
};

}  // namespace veltrad::session
