// Whether and how a back end reports for one client entry of its storebag section. Plain functions from
// values to a verdict; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "config/client_entry.h"

namespace veltrad::backends {

// What is known of the client, the device and the user at the time of the decision.
struct ClientFacts {
  bool consent = false;                // the user's, to diagnostic submission
  std::optional<std::string> country;  // the current locale's
  std::string productFamily;
  std::optional<std::string> hardwareType;
  double samplingFactor = 0;  // this back end's draw, in [0, 1)
};

enum class ClientRefusal {
  none,
  consentMissing,    // no consent, and the entry does not override it
  countryNotListed,  // "locale_whitelist", which must not be empty
  deviceNotListed,   // "device_whitelist"
  deviceListed,      // "device_blacklist"
  filtersMissing,    // "filters" is required
  thresholdMissing,  // no "sampling_threshold", and no country's own
  sampledOut,        // above the threshold and above "override_sampling"
};

// A refusal ends the decision at once: what later steps would have found is absent.
struct ClientVerdict {
  std::int32_t state = 1;  // BackendState: 1 disabled, 2 reporting, 3 held by sampling
  ClientRefusal refusal = ClientRefusal::none;
  std::int32_t hierarchy = 0;
  std::int32_t overrideDNU = 0;  // the entry's own number; 1 overrides consent
  std::int32_t dnuType = 0;      // 0 consent respected; overridden: 1 without consent, 2 with it
  const config::Filters* filters = nullptr;

  bool samplingReached = false;
  std::optional<double> threshold;
  // A per-country entry replaced the threshold; this is what it was.
  bool countryThreshold = false;
  std::optional<double> thresholdBefore;
  // Set when the factor lies above the threshold: then the entry's "override_sampling".
  bool overrideReached = false;
  std::optional<double> overrideSampling;
};

ClientVerdict decideOnClient(const config::ClientEntry& entry, const ClientFacts& facts);

// The counter's text of a refusal.
const char* reasonOf(ClientRefusal refusal);

}  // namespace veltrad::backends
