// The decision on a client entry, step by step.
#include "backends/https/client_decision.h"

#include "backends/backend.h"
#include "backends/https/text_lists.h"

namespace veltrad::backends {

namespace {
// The first element whose "country" array holds the country, letter case respected; or null.
const Dictionary* countryEntry(const Dictionary& entry, const std::optional<std::string>& country) {
  const Array* elements = entry.array("per_country_sampling_thresholds");
  if (!elements || !country) return nullptr;
  for (const Value& element : *elements) {
    const Dictionary* candidate = element.asDictionary();
    const Array* countries = candidate ? candidate->array("country") : nullptr;
    if (!countries) continue;
    for (const Value& listed : *countries) {
      const std::string* code = listed.asString();
      if (code && *code == *country) return candidate;
    }
  }
  return nullptr;
}

std::optional<wire::Reason> refusalOfLists(const Dictionary& entry, const ClientFacts& facts) {
  if (!matchStringWithList(textsOf(entry.array("locale_whitelist")), facts.country, false)) {
    return wire::Reason::country_not_listed;
  }
  if (!matchStringWithList(textsOf(entry.array("device_whitelist")), facts.productFamily, true)) {
    return wire::Reason::device_not_listed;
  }
  if (matchStringWithList(textsOf(entry.array("device_blacklist")), facts.hardwareType, false)) {
    return wire::Reason::device_refused;
  }
  return std::nullopt;
}

void decideOnSampling(const Dictionary& entry, const ClientFacts& facts, ClientVerdict& verdict) {
  verdict.samplingReached = true;
  verdict.threshold = entry.real("sampling_threshold");
  if (const Dictionary* own = countryEntry(entry, facts.country)) {
    verdict.countryThreshold = true;
    verdict.thresholdBefore = verdict.threshold;
    verdict.threshold = own->real("threshold");
  }
  if (!verdict.threshold) {
    verdict.reason = wire::Reason::no_threshold;
    return;
  }
  // A factor equal to the threshold is sampled in.
  if (facts.samplingFactor <= *verdict.threshold) {
    verdict.state = kBackendReporting;
    return;
  }
  verdict.overrideReached = true;
  verdict.overrideSampling = entry.real("override_sampling");
  if (!verdict.overrideSampling || facts.samplingFactor <= *verdict.overrideSampling) {
    verdict.state = kBackendHeld;
    verdict.reason = wire::Reason::held_by_sampling;
  } else {
    verdict.reason = wire::Reason::sampled_out;
  }
}
}  // namespace

ClientVerdict decideOnClient(const Dictionary& entry, const ClientFacts& facts) {
  ClientVerdict verdict;
  verdict.state = kBackendDisabled;
  verdict.hierarchy = entry.int32("hierarchy").value_or(0);
  verdict.overrideDNU = entry.int32("override_dnu").value_or(0);
  if (verdict.overrideDNU == 1) {
    verdict.dnuType = facts.consent ? 2 : 1;
  } else if (!facts.consent) {
    verdict.reason = wire::Reason::no_consent;
    return verdict;
  }
  verdict.reason = refusalOfLists(entry, facts);
  if (verdict.reason) return verdict;
  verdict.filters = entry.array("filters");
  if (!verdict.filters) {
    verdict.reason = wire::Reason::no_filters;
    return verdict;
  }
  decideOnSampling(entry, facts, verdict);
  return verdict;
}

}  // namespace veltrad::backends
