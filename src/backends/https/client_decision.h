// Whether and how a back end reports for one client entry of its storebag section. Plain functions from
// values to a verdict; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "config/client_entry.h"
#include "wire/reasons.h"

namespace veltrad::backends {

// What is known of the client, the device and the user at the time of the decision.
struct ClientFacts {
  bool consent = false;                // the user's, to diagnostic submission
  std::optional<std::string> country;  // the current locale's
  std::string productFamily;
  std::optional<std::string> hardwareType;
  double samplingFactor = 0;  // this back end's draw, in [0, 1)
};

// A reason to be disabled ends the decision at once: what later steps would have found is absent.
struct ClientVerdict {
  std::int32_t state = 1;              // BackendState: 1 disabled, 2 reporting, 3 held by sampling
  std::optional<wire::Reason> reason;  // unless it reports
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

}  // namespace veltrad::backends
