// Base64 by RFC 4648, section 4, without line breaks on the way out. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veltrad {

std::string encodeBase64(std::string_view bytes);

// Characters outside the alphabet (line breaks, blanks, anything else) are skipped. Nothing when what remains
// is no base64: a lone character in the last group, padding that is missing or too long, or characters after
// the padding.
std::optional<std::string> decodeBase64(std::string_view text);

}  // namespace veltrad
