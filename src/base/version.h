// The version of all programs and of the library, "8.0".
#pragma once

namespace veltrad {

extern const char* const kVersion;

}  // namespace veltrad
