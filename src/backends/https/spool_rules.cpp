// SPDX-License-Identifier: Apache-2.0
// Reads what the verdict needs.
#include "backends/https/spool_rules.h"

#include "backends/https/spool_verdicts.h"
#include "config/owner_gate.h"
#include "config/preference_keys.h"
#include "platform/locale.h"
#include "platform/preferences.h"
#include "support/device_identity.h"
#include "support/spool_entry.h"

namespace veltrad::backends {

std::optional<wire::Reason> SpoolRules::refusal(const support::SpoolEntry& post, SectionSource* sections,
                                                bool fetch) {
  const auto section = sections && post.asksEntry ? sections->sectionFor(post.clientType(), fetch) : nullptr;
  const ClientFacts facts{word({}).consent, _sources.locale.countryCode(),
                          _sources.device.deviceName().value_or(""), _sources.device.deviceProductType(), 0};
  return refusalToLeave(post, *_sources.gate.word(), section.get(), facts);
}

std::optional<wire::Reason> SpoolRules::refusalOfAll() const {
  return _sources.gate.word()->refusal;
}

SpoolRules::Word SpoolRules::word(const Word& before) const {
  const auto found =
      _sources.preferences.lookUp(platform::kVeltraPreferenceDomain, config::preference::kConsent);
  const bool consent = found ? found.value() && found.value()->toBoolean().value_or(false) : before.consent;
  return {_sources.gate.turn(), consent};
}

}  // namespace veltrad::backends
