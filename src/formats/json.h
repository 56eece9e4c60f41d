// SPDX-License-Identifier: Apache-2.0
// Reads and writes values as JSON (RFC 8259).
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::formats {

struct JSONError {
  // In bytes from the start of the text.
  std::size_t offset;
  // One line.
  std::string detail;
};

// Numbers without a fraction or exponent become integers (reals beyond 64 bits), {"$date": seconds since
// 1970} a date, and {"$data": "base64"} data. Entries whose value is null are left out; elsewhere null is an
// error. At most 64 levels deep; of equal keys the last one counts.
Result<Value, JSONError> parseJSON(std::string_view text);
// The same where "// …" and "/* … */" may stand between the tokens.
Result<Value, JSONError> parseJSONWithComments(std::string_view text);
// Where in a text that parseJSONWithComments takes the key or the element of an array begins that `path`
// leads to: keys, and numbers of elements from 0 in decimal. Nothing: it is not there.
std::optional<std::size_t> offsetInJSON(std::string_view text, const std::vector<std::string>& path);

enum class JSONStyle { compact, pretty };
// The reverse of parseJSON. A real that is not finite becomes null, an invalid byte of a text U+FFFD.
std::string writeJSON(const Value& value, JSONStyle style = JSONStyle::compact);

// Appends the readable form of a compact text, which may come in pieces, to a string: each field and element
// on a line of its own.
class JSONIndenter {
 public:
  explicit JSONIndenter(std::string& out) : _out(out) {}
  void add(std::string_view compact);

 private:
  void addText(std::string_view& compact);
  void newLine();

  std::string& _out;
  std::size_t _depth = 0;
  // The last character was an opening bracket; it was inside a text; it was a backslash there.
  bool _opened = false;
  bool _inText = false;
  bool _escaped = false;
};

// The first bytes of the compact text, at most `most` of them and whole characters, and the number of bytes
// left out. The rest of the text is never in memory.
struct JSONExcerpt {
  std::string text;
  std::size_t leftOut = 0;
};
JSONExcerpt excerptOfJSON(const Value& value, std::size_t most);

}  // namespace veltrad::formats
