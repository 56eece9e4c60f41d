// SPDX-License-Identifier: Apache-2.0
// Collects the facts that decide whether a kept post may leave: the owner's decision, the machine, and a
// section. Any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>

#include "backends/https/spool_verdicts.h"
#include "config/owner_gate.h"
#include "config/storebag_content.h"
#include "wire/reasons.h"

namespace veltrad::platform {
class Locale;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
struct SpoolEntry;
}  // namespace veltrad::support

namespace veltrad::backends {

class SpoolRules {
 public:
  struct Sources {
    config::OwnerGate& gate;
    platform::Preferences& preferences;
    platform::Locale& locale;
    support::DeviceIdentity& device;
  };
  // The sources must outlive it.
  explicit SpoolRules(const Sources& sources) : _sources(sources) {}

  // The facts of the machine, for a group of posts; absent if they cannot be read at the moment.
  std::optional<ClientFacts> facts() const;
  // As in spool_verdicts.h, with the owner's current decision.
  LeaveVerdict verdict(const support::SpoolEntry& post, const config::StorebagSection* section,
                       const std::optional<ClientFacts>& facts) const {
    return verdictOnLeaving(post, *_sources.gate.decision(), section, facts);
  }
  std::optional<wire::Reason> ownersRefusal(const support::SpoolEntry& post) const {
    return refusalByOwner(post, *_sources.gate.decision());
  }
  // Why nothing may leave.
  std::optional<wire::Reason> refusalOfAll() const { return _sources.gate.decision()->refusal; }

  // The owner's decision; changes with the policy and the consent, not during a shortage.
  struct OwnerState {
    std::uint64_t turn = 0;
    bool consent = false;
    bool operator==(const OwnerState&) const = default;
  };
  OwnerState ownerState(const OwnerState& before) const;

 private:
  // Absent if it cannot be read at the moment.
  std::optional<bool> consent() const;

  const Sources _sources;
};

}  // namespace veltrad::backends
