// SPDX-License-Identifier: Apache-2.0
// The fixed tables of client types and environments.
#pragma once

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>

namespace veltrad::config {

// Client types (also called component types) are 0 to kVeltraClientTypeCount - 1.
inline constexpr std::int32_t kVeltraClientTypeCount = 18;

// The last path component of the storebag's URL. Null for client types without a storebag, and outside the
// range.
const char* storebagNameForClientType(std::int32_t clientType);
// The first client type that has this storebag.
std::optional<std::int32_t> clientTypeWithStorebag(std::string_view name);
// The names of all storebags, each once.
std::set<std::string> storebagNames();

// The code that identifies sessions of this type in reports. Null outside the range.
const char* senderCodeForComponentType(std::int32_t componentType);

// The name of a storebag's section: 1 "development", 2 "florn_internal", 3 "seed", 4 "release"; else null.
const char* sectionNameForEnvironment(std::uint32_t environment);

}  // namespace veltrad::config
