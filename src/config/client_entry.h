// SPDX-License-Identifier: Apache-2.0
// A parsed entry of the "clients" of an HTTPS post back end.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "config/key_table.h"

namespace veltrad::config {

enum class FilterAction : std::int32_t { keep, remove, sha256 };
// Any other text keeps the field.
inline constexpr std::pair<const char*, FilterAction> kFilterActions[] = {{"remove", FilterAction::remove},
                                                                          {"sha256", FilterAction::sha256}};
void take(const Key& key, const Value& value, FilterAction& field);

// One element of "filters".
struct filterTag {
  // A negative method or status matches every one.
  std::int32_t method = -1;
  std::int32_t status = -1;
  FilterAction action = FilterAction::keep;
  // Letter case is ignored. Without a key the filter matches nothing.
  std::optional<std::string> key;

  bool operator==(const filterTag&) const = default;
  static const KeyTable kKeys;
};

struct Filters {
  // The number of elements in the array, valid or not.
  std::size_t elements = 0;
  // By their keys in lower case, in the order of the array.
  std::unordered_map<std::string, std::vector<filterTag>> ofKey;

  bool operator==(const Filters&) const = default;
};
void take(const Key& key, const Value& value, std::optional<Filters>& field);

// One element of "per_country_sampling_thresholds".
struct CountryThreshold {
  TextList country;
  std::optional<double> threshold;

  bool operator==(const CountryThreshold&) const = default;
  static const KeyTable kKeys;
};

// Its 17 fields are the keys of an entry, in the order in which they are evaluated.
struct ClientEntry {
  std::vector<std::string> client;
  std::vector<std::string> service;
  std::optional<double> expedite;
  std::int32_t hierarchy = 0;
  std::int32_t overrideDNU = 0;
  TextList localeWhitelist;
  TextList deviceWhitelist;
  TextList deviceBlacklist;
  std::optional<Filters> filters;
  std::optional<double> samplingThreshold;
  std::optional<std::vector<CountryThreshold>> perCountrySamplingThresholds;
  std::optional<double> overrideSampling;
  std::int32_t eventThreshold = 0;
  std::int32_t extrasOnInternal = 0;
  bool customClientID = false;
  std::optional<std::string> postURL;
  std::optional<std::string> realtimePostURL;

  bool operator==(const ClientEntry&) const = default;
  static const KeyTable kKeys;
};

}  // namespace veltrad::config
