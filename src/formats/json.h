// JSON by RFC 8259 to and from Value. Any thread. Exceptions: none.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::formats {

struct JSONError {
  std::size_t offset;  // in bytes from the start of the text
  std::string detail;  // one line
};

// Numbers without a fraction or exponent become integers (beyond 64 bits: reals); {"$date": seconds since
// 1970} becomes a date, {"$data": "base64"} data; null entries of a dictionary are left out, elsewhere null
// is an error. Depth at most 64; duplicate keys: the last one counts.
Result<Value, JSONError> parseJSON(std::string_view text);
// The same where "// …" and "/* … */" may stand between the tokens.
Result<Value, JSONError> parseJSONWithComments(std::string_view text);
// Where in a text that parseJSONWithComments takes the key or the element of an array begins that `path`
// leads to: keys, and numbers of elements from 0 in decimal. Nothing: it is not there.
std::optional<std::size_t> offsetInJSON(std::string_view text, const std::vector<std::string>& path);

enum class JSONStyle { compact, pretty };
// The reverse of parseJSON. A real that is not finite is written as null; a text that is no UTF-8 is mended.
// With `expectedBytes` near its length, the text does not grow, and keep twice its bytes, while it is
// written.
std::string writeJSON(const Value& value, JSONStyle style = JSONStyle::compact,
                      std::size_t expectedBytes = 0);
// The beginning of the compact text, at most `most` bytes and whole characters, and how many bytes are left
// out. Keeps no more than that, however long the text would be.
struct JSONExcerpt {
  std::string text;
  std::size_t leftOut = 0;
};
JSONExcerpt excerptOfJSON(const Value& value, std::size_t most);
// A bound on the bytes of the compact text of a dictionary of texts, numbers, booleans and dates, without
// writing it; containers and data in it are not counted.
std::size_t jsonBytesAtMost(const Dictionary& flat);

}  // namespace veltrad::formats
