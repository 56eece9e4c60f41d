// UTF-8, letter case and the escaping of log lines. Pure functions; any thread.
#pragma once

#include <string>
#include <string_view>

namespace veltrad {

// RFC 3629: no surrogates, no overlong forms, nothing above U+10FFFF.
bool isUTF8(std::string_view bytes);
// Each byte that belongs to no valid sequence becomes U+FFFD.
std::string toUTF8(std::string_view bytes);
// Loses an incomplete sequence at the end, nothing else.
std::string_view withoutIncompleteEnd(std::string_view text);

// Unicode's simple lower-case mapping, character by character. Bytes that are no UTF-8 stay as they are.
std::string lowerCase(std::string_view text);
bool equalIgnoringCase(std::string_view a, std::string_view b);
bool containsIgnoringCase(std::string_view text, std::string_view part);

// For one log line: valid UTF-8 stays; controls, DEL, C1 controls, U+2028, U+2029 and bytes that are no UTF-8 become
// \xNN for each byte; a backslash is doubled.
std::string escapedForLog(std::string_view text);

}  // namespace veltrad
