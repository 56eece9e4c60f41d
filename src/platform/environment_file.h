// Files of NAME=value lines, as os-release and locale.conf are. A pure function; any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veltrad::platform {

// Format: os-release(5). The last line of that name counts; quotes and the backslashes inside double quotes
// are taken away. Nothing when there is no such line or its value is empty.
std::optional<std::string> valueInEnvironmentFile(std::string_view text, std::string_view name);

}  // namespace veltrad::platform
