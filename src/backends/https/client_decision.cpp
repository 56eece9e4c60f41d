// SPDX-License-Identifier: Apache-2.0
// Decides in the order in which a client entry's conditions apply.
#include "backends/https/client_decision.h"

#include <algorithm>

#include "backends/backend.h"
#include "backends/https/text_lists.h"

namespace veltrad::backends {

namespace {
// The first element whose "country" array contains the country (case-sensitive); null if none does.
const config::CountryThreshold* countryEntry(const config::ClientEntry& entry,
                                             const std::optional<std::string>& country) {
  if (!entry.perCountrySamplingThresholds || !country) return nullptr;
  for (const config::CountryThreshold& candidate : *entry.perCountrySamplingThresholds) {
    const auto& listed = candidate.country.texts;
    if (std::find(listed.begin(), listed.end(), *country) != listed.end()) return &candidate;
  }
  return nullptr;
}

std::optional<wire::Reason> refusalOfLists(const config::ClientEntry& entry, const ClientFacts& facts) {
  if (!matchStringWithList(entry.localeWhitelist.texts, facts.country, false)) {
    return wire::Reason::country_not_listed;
  }
  if (!matchStringWithList(entry.deviceWhitelist.texts, facts.productFamily, true)) {
    return wire::Reason::device_not_listed;
  }
  if (matchStringWithList(entry.deviceBlacklist.texts, facts.hardwareType, false)) {
    return wire::Reason::device_refused;
  }
  return std::nullopt;
}

void decideOnSampling(const config::ClientEntry& entry, const ClientFacts& facts, ClientVerdict& verdict) {
  verdict.samplingReached = true;
  verdict.threshold = entry.samplingThreshold;
  if (const config::CountryThreshold* own = countryEntry(entry, facts.country)) {
    verdict.countryThreshold = true;
    verdict.thresholdBefore = verdict.threshold;
    verdict.threshold = own->threshold;
  }
  if (!verdict.threshold) {
    verdict.reason = wire::Reason::no_threshold;
    return;
  }
  if (facts.samplingFactor <= *verdict.threshold) {
    verdict.state = kBackendReporting;
    return;
  }
  verdict.overrideReached = true;
  verdict.overrideSampling = entry.overrideSampling;
  if (!verdict.overrideSampling || facts.samplingFactor <= *verdict.overrideSampling) {
    verdict.state = kBackendHeld;
    verdict.reason = wire::Reason::held_by_sampling;
  } else {
    verdict.reason = wire::Reason::sampled_out;
  }
}
}  // namespace

std::optional<wire::Reason> refusalBeforeSampling(const config::ClientEntry& entry,
                                                  const ClientFacts& facts) {
  if (entry.overrideDNU != 1 && !facts.consent) return wire::Reason::no_consent;
  if (auto refused = refusalOfLists(entry, facts)) return refused;
  return entry.filters ? std::nullopt : std::optional(wire::Reason::no_filters);
}

ClientVerdict decideOnClient(const config::ClientEntry& entry, const ClientFacts& facts) {
  ClientVerdict verdict;
  verdict.state = kBackendDisabled;
  verdict.hierarchy = entry.hierarchy;
  verdict.overrideDNU = entry.overrideDNU;
  if (verdict.overrideDNU == 1) verdict.dnuType = facts.consent ? 2 : 1;
  verdict.reason = refusalBeforeSampling(entry, facts);
  if (verdict.reason) return verdict;
  verdict.filters = &*entry.filters;
  decideOnSampling(entry, facts, verdict);
  return verdict;
}

}  // namespace veltrad::backends
