// The fixed tables of client types and environments.
#pragma once

#include <cstdint>

namespace veltrad::config {

// Client types (also called component types) are 0 to kVeltraClientTypeCount - 1.
inline constexpr std::int32_t kVeltraClientTypeCount = 18;

// The last path component of the storebag's URL. Null for client types without a storebag, and outside the
// range.
const char* storebagNameForClientType(std::int32_t clientType);

// The code that identifies sessions of this type in reports. Null outside the range.
const char* senderCodeForComponentType(std::int32_t componentType);

// The name of a storebag's section: 1 "development", 2 "florn_internal", 3 "seed", 4 "release"; else null.
const char* sectionNameForEnvironment(std::uint32_t environment);

}  // namespace veltrad::config
