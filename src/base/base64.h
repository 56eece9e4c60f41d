// SPDX-License-Identifier: Apache-2.0
// Base64 (RFC 4648, section 4), encoded without line breaks.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veltrad {

std::string encodeBase64(std::string_view bytes);

// Skips characters outside the alphabet, such as line breaks and blanks. Absent if the rest is not valid: a
// single character in the last group, missing or excess padding, or characters after the padding.
std::optional<std::string> decodeBase64(std::string_view text);

}  // namespace veltrad
