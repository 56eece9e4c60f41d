// SPDX-License-Identifier: Apache-2.0
// Decides whether and how a back end reports for one client entry of its storebag section.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "config/client_entry.h"
#include "wire/reasons.h"

namespace veltrad::backends {

// The client, the device and the user at the time of the decision.
struct ClientFacts {
  // The user's consent to diagnostic submission.
  bool consent = false;
  // The country of the current locale.
  std::optional<std::string> country;
  std::string productFamily;
  std::optional<std::string> hardwareType;
  double samplingFactor = 0;
};

// The decision ends at the first reason to be disabled; the results of later steps are then absent.
struct ClientVerdict {
  // A BackendState: disabled, reporting or held by sampling.
  std::int32_t state = 1;
  // Unless it reports.
  std::optional<wire::Reason> reason;
  std::int32_t hierarchy = 0;
  // The number in the entry; 1 overrides consent.
  std::int32_t overrideDNU = 0;
  // 0: consent is respected. 1: it is overridden and absent. 2: it is overridden and given.
  std::int32_t dnuType = 0;
  const config::Filters* filters = nullptr;

  bool samplingReached = false;
  std::optional<double> threshold;
  // A per-country entry replaced the threshold; this was its value before.
  bool countryThreshold = false;
  std::optional<double> thresholdBefore;
  // The factor is above the threshold, so the entry's "override_sampling" applies.
  bool overrideReached = false;
  std::optional<double> overrideSampling;
};

// Why it may not report, independent of sampling: no_consent, the lists, no_filters.
std::optional<wire::Reason> refusalBeforeSampling(const config::ClientEntry& entry, const ClientFacts& facts);

ClientVerdict decideOnClient(const config::ClientEntry& entry, const ClientFacts& facts);

}  // namespace veltrad::backends
