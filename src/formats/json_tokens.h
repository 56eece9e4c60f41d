// SPDX-License-Identifier: Apache-2.0
// The tokens of a JSON text, comments among them.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace veltrad::formats {

struct JSONToken {
  // `scalar`: a text with its quotes, a number or a word. `end`: there are no more.
  enum class Kind { openObject, closeObject, openArray, closeArray, colon, comma, scalar, comment, end };
  Kind kind;
  // In bytes from the start of the text.
  std::size_t offset;
  std::string_view text;
};

// Splits a text that parseJSONWithComments takes, which must outlive it and its tokens.
class JSONTokens {
 public:
  explicit JSONTokens(std::string_view text) : _text(text) {}
  JSONToken next();

 private:
  std::size_t endOfComment() const;
  std::size_t endOfString() const;

  const std::string_view _text;
  std::size_t _at = 0;
};

// The decoded text of a text token.
std::string textOfToken(std::string_view token);

}  // namespace veltrad::formats
