// SPDX-License-Identifier: Apache-2.0
// The fixed tables of client types and environments.
#include "config/client_types.h"

#include <array>

namespace veltrad::config {
namespace {

constexpr std::array<const char*, kVeltraClientTypeCount> kStorebagNames = {
    nullptr,    nullptr,     nullptr,   nullptr,   nullptr,   "pellmarch", "ostvane", "quindle", "brevatto",
    "sollwick", "tamberlin", "quindle", "crovish", "quindle", "ostvane",   "ostvane", "melkard", "yarrowin",
};

constexpr std::array<const char*, kVeltraClientTypeCount> kSenderCodes = {
    "PV", "DR", "XLN", "BQ",   "HW",    "ZE",     "FU",       "JY",      "KO",
    "WA", "UT", "EB",  "MYRT", "QOLIN", "FU-GLP", "FU-TOLMS", "GARNOVE", "LIMBET",
};

constexpr std::array<const char*, 5> kSectionNames = {nullptr, "development", "florn_internal", "seed",
                                                      "release"};

template <typename Table, typename Index>
const char* entry(const Table& table, Index index) {
  const auto place = static_cast<std::uint32_t>(index);  // a negative index becomes one beyond the end
  return place < table.size() ? table[place] : nullptr;
}

}  // namespace

const char* storebagNameForClientType(std::int32_t clientType) {
  return entry(kStorebagNames, clientType);
}
std::optional<std::int32_t> clientTypeWithStorebag(std::string_view name) {
  for (std::int32_t type = 0; type < kVeltraClientTypeCount; ++type) {
    const char* known = storebagNameForClientType(type);
    if (known && known == name) return type;
  }
  return std::nullopt;
}
std::set<std::string> storebagNames() {
  std::set<std::string> names;
  for (const char* name : kStorebagNames) {
    if (name) names.insert(name);
  }
  return names;
}
const char* senderCodeForComponentType(std::int32_t componentType) {
  return entry(kSenderCodes, componentType);
}
const char* sectionNameForEnvironment(std::uint32_t environment) {
  return entry(kSectionNames, environment);
}

}  // namespace veltrad::config
