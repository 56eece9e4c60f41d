// SPDX-License-Identifier: Apache-2.0
// Reads values from files of NAME=value lines, such as os-release and locale.conf.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veltrad::platform {

// Format: os-release(5). The last line with this name counts; quotes, and backslashes outside single quotes,
// are removed. Absent if there is no such line or its value is empty.
std::optional<std::string> valueInEnvironmentFile(std::string_view text, std::string_view name);

}  // namespace veltrad::platform
