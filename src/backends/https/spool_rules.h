// SPDX-License-Identifier: Apache-2.0
// Asks what decides whether a kept post may leave: the owner, the machine, and a section. Any thread.
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
  // The sources outlive it.
  explicit SpoolRules(const Sources& sources) : _sources(sources) {}

  // What the machine says, for as many posts as are asked for at once; nothing: it cannot be read just now.
  std::optional<ClientFacts> facts() const;
  // As in spool_verdicts.h, by the owner's word of now.
  LeaveVerdict verdict(const support::SpoolEntry& post, const config::StorebagSection* section,
                       const std::optional<ClientFacts>& facts) const {
    return verdictOnLeaving(post, *_sources.gate.word(), section, facts);
  }
  std::optional<wire::Reason> ownersRefusal(const support::SpoolEntry& post) const {
    return refusalByOwner(post, *_sources.gate.word());
  }
  // Why nothing may leave.
  std::optional<wire::Reason> refusalOfAll() const { return _sources.gate.word()->refusal; }

  // What the owner says; changes with the policy and the consent. A shortage is no change.
  struct Word {
    std::uint64_t turn = 0;
    bool consent = false;
    bool operator==(const Word&) const = default;
  };
  Word word(const Word& before) const;

 private:
  // Nothing: it cannot be read just now.
  std::optional<bool> consent() const;

  const Sources _sources;
};

}  // namespace veltrad::backends
