// The decision on a client entry, step by step.
#include "backends/https/client_decision.h"

#include <algorithm>

#include "backends/backend.h"
#include "backends/https/text_lists.h"

namespace veltrad::backends {

namespace {
// The first element whose "country" array holds the country, letter case respected; or null.
const config::CountryThreshold* countryEntry(const config::ClientEntry& entry,
                                             const std::optional<std::string>& country) {
  if (!entry.perCountrySamplingThresholds || !country) return nullptr;
  for (const config::CountryThreshold& candidate : *entry.perCountrySamplingThresholds) {
    const auto& listed = candidate.country.texts;
    if (std::find(listed.begin(), listed.end(), *country) != listed.end()) return &candidate;
  }
  return nullptr;
}

ClientRefusal refusalOfLists(const config::ClientEntry& entry, const ClientFacts& facts) {
  if (!matchStringWithList(entry.localeWhitelist.texts, facts.country, false)) {
    return ClientRefusal::countryNotListed;
  }
  if (!matchStringWithList(entry.deviceWhitelist.texts, facts.productFamily, true)) {
    return ClientRefusal::deviceNotListed;
  }
  if (matchStringWithList(entry.deviceBlacklist.texts, facts.hardwareType, false)) {
    return ClientRefusal::deviceListed;
  }
  return ClientRefusal::none;
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
    verdict.refusal = ClientRefusal::thresholdMissing;
    return;
  }
  // A factor equal to the threshold is sampled in.
  if (facts.samplingFactor <= *verdict.threshold) {
    verdict.state = kBackendReporting;
    return;
  }
  verdict.overrideReached = true;
  verdict.overrideSampling = entry.overrideSampling;
  if (!verdict.overrideSampling || facts.samplingFactor <= *verdict.overrideSampling) {
    verdict.state = kBackendHeld;
  } else {
    verdict.refusal = ClientRefusal::sampledOut;
  }
}
}  // namespace

ClientVerdict decideOnClient(const config::ClientEntry& entry, const ClientFacts& facts) {
  ClientVerdict verdict;
  verdict.state = kBackendDisabled;
  verdict.hierarchy = entry.hierarchy;
  verdict.overrideDNU = entry.overrideDNU;
  if (verdict.overrideDNU == 1) {
    verdict.dnuType = facts.consent ? 2 : 1;
  } else if (!facts.consent) {
    verdict.refusal = ClientRefusal::consentMissing;
    return verdict;
  }
  verdict.refusal = refusalOfLists(entry, facts);
  if (verdict.refusal != ClientRefusal::none) return verdict;
  verdict.filters = entry.filters ? &*entry.filters : nullptr;
  if (!verdict.filters) {
    verdict.refusal = ClientRefusal::filtersMissing;
    return verdict;
  }
  decideOnSampling(entry, facts, verdict);
  return verdict;
}

const char* reasonOf(ClientRefusal refusal) {
  switch (refusal) {
    case ClientRefusal::none:
      return "";
    case ClientRefusal::consentMissing:
      return "back end disabled: no consent to diagnostic submission";
    case ClientRefusal::countryNotListed:
      return "back end disabled: the country is not in locale_whitelist";
    case ClientRefusal::deviceNotListed:
      return "back end disabled: the device is not in device_whitelist";
    case ClientRefusal::deviceListed:
      return "back end disabled: the device is in device_blacklist";
    case ClientRefusal::filtersMissing:
      return "back end disabled: the client entry has no filters";
    case ClientRefusal::thresholdMissing:
      return "back end disabled: the client entry has no sampling threshold";
    case ClientRefusal::sampledOut:
      return "back end disabled: sampled out";
  }
  return "";
}

}  // namespace veltrad::backends
