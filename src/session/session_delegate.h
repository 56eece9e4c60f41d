// What a session asks of the registry: storebags and its place among related sessions. Each session's own
// thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad {

class VeltradSession;

class VeltradSessionDelegate {
 public:
  virtual ~VeltradSessionDelegate() = default;

  // The storebag section for the session's client type, or null. May download and block for the exchange.
  virtual std::shared_ptr<const Dictionary> storebagForSession(const VeltradSession& session) = 0;
  // Never downloads.
  virtual std::optional<std::string> storebagVersionForSession(const VeltradSession& session) = 0;
  // The session joins the list of its user-info key, leaving any other.
  virtual void userInfoUpdatedForSession(const std::shared_ptr<VeltradSession>& session) = 0;
  // Refreshes the session and every session below it.
  virtual void updateDownstreamSessions(const std::shared_ptr<VeltradSession>& session) = 0;
  // For log lines.
  virtual std::string description() const = 0;
};

}  // namespace veltrad
