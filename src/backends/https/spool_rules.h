// SPDX-License-Identifier: Apache-2.0
// Asks what decides whether a kept post may leave: the owner, the storebag in force, the machine. Any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>

#include "config/storebag_content.h"
#include "wire/reasons.h"

namespace veltrad::config {
class OwnerGate;
}  // namespace veltrad::config

namespace veltrad::platform {
class Locale;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
struct SpoolEntry;
}  // namespace veltrad::support

namespace veltrad::backends {

class SectionSource {
 public:
  virtual ~SectionSource() = default;
  // The section for a client type; null: there is none. `fetch`: as for a session, which may wait for a
  // download; else only what is known.
  virtual std::shared_ptr<const config::StorebagSection> sectionFor(std::int32_t clientType, bool fetch) = 0;
};

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

  // Why the post may not leave. Without `sections` it is decided as if none could be had.
  std::optional<wire::Reason> refusal(const support::SpoolEntry& post, SectionSource* sections, bool fetch);
  // Why nothing may leave.
  std::optional<wire::Reason> refusalOfAll() const;

  // What the owner says; changes with the policy and the consent. A shortage is no change.
  struct Word {
    std::uint64_t turn = 0;
    bool consent = false;
    bool operator==(const Word&) const = default;
  };
  Word word(const Word& before) const;

 private:
  const Sources _sources;
};

}  // namespace veltrad::backends
