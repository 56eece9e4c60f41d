// SPDX-License-Identifier: Apache-2.0
// Reads what the verdict needs.
#include "backends/https/spool_rules.h"

#include <utility>

#include "config/preference_keys.h"
#include "platform/locale.h"
#include "platform/preferences.h"
#include "support/device_identity.h"

namespace veltrad::backends {

std::optional<bool> SpoolRules::consent() const {
  const auto found =
      _sources.preferences.lookUp(platform::kVeltraPreferenceDomain, config::preference::kConsent);
  if (!found) return std::nullopt;
  return found.value() && found.value()->toBoolean().value_or(false);
}

std::optional<ClientFacts> SpoolRules::facts() const {
  const auto given = consent();
  auto device = _sources.device.nameAndType();
  if (!given || !device) return std::nullopt;
  return ClientFacts{*given, _sources.locale.countryCode(), std::move(device->name).value_or(""),
                     std::move(device->productType), 0};
}

SpoolRules::OwnerState SpoolRules::ownerState(const OwnerState& before) const {
  return {_sources.gate.turn(), consent().value_or(before.consent)};
}

}  // namespace veltrad::backends
