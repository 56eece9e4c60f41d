// The version of all programs and of the library: that of the project, "8.0". Any thread.
#pragma once

namespace veltrad {

extern const char* const kVersion;

}  // namespace veltrad
