// SPDX-License-Identifier: Apache-2.0
// The owner's decision as one session applies it. The session's thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "backends/session_facts.h"
#include "config/owner_gate.h"
#include "session/backend_set.h"

namespace veltrad::session {

class OwnerFilter {
 public:
  // The gate must outlive it.
  explicit OwnerFilter(const config::OwnerGate& gate) : _gate(gate) {}

  // If the owner's decision has changed, takes it over and calls `obey`, until it stays the same. If `obey`
  // throws, the next call tries again.
  void hear(const std::function<void()>& obey);
  const config::OwnerDecision& now() const { return *_decision; }
  // If the identifiers were reset since the decision before, reads the device's identifier again and makes
  // the back ends read theirs. The back ends also read the consent again if the policy requires it. `set` may
  // be null.
  void takeIdentity(support::DeviceIdentity& device, char (&deviceID)[41], const BackendSet* set) const;
  // Adds the part that may leave: null stays null, and user info without withheld fields stays the same
  // object.
  backends::UserInfo allowed(const backends::SharedDictionary& userInfo) const;
  // Remove the fields that the owner withholds, and return their names.
  config::EditedFields restrict(std::optional<Dictionary>& payload) const;
  config::EditedFields restrict(Array& logData) const;

 private:
  const config::OwnerGate& _gate;
  std::uint64_t _heard = 0;
  bool _reset = false;
  std::shared_ptr<const config::OwnerDecision> _decision = std::make_shared<const config::OwnerDecision>();
};

}  // namespace veltrad::session
