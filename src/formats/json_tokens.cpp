// SPDX-License-Identifier: Apache-2.0
// Splits valid JSON into tokens.
#include "formats/json_tokens.h"

#include <algorithm>

#include "formats/json.h"

namespace veltrad::formats {

namespace {
constexpr std::string_view kBlanks = " \t\r\n";

JSONToken::Kind kindOf(char first) {
  using Kind = JSONToken::Kind;
  switch (first) {
    case '{':
      return Kind::openObject;
    case '}':
      return Kind::closeObject;
    case '[':
      return Kind::openArray;
    case ']':
      return Kind::closeArray;
    case ':':
      return Kind::colon;
    case ',':
      return Kind::comma;
    case '/':
      return Kind::comment;
    default:
      return Kind::scalar;
  }
}
}  // namespace

JSONToken JSONTokens::next() {
  _at = std::min(_text.find_first_not_of(kBlanks, _at), _text.size());
  const std::size_t start = _at;
  if (start == _text.size()) return {JSONToken::Kind::end, start, {}};
  const JSONToken::Kind kind = kindOf(_text[start]);
  if (kind == JSONToken::Kind::comment) {
    _at = endOfComment();
  } else if (kind != JSONToken::Kind::scalar) {
    ++_at;
  } else if (_text[start] == '"') {
    _at = endOfString();
  } else {
    _at = std::min(_text.find_first_of(" \t\r\n,:]}/", start), _text.size());
  }
  return {kind, start, _text.substr(start, _at - start)};
}

std::size_t JSONTokens::endOfComment() const {
  const bool isLine = _text.substr(_at, 2) == "//";
  const std::size_t end = isLine ? _text.find('\n', _at) : _text.find("*/", _at + 2);
  if (end == std::string_view::npos) return _text.size();
  if (!isLine) return end + 2;
  return _text[end - 1] == '\r' ? end - 1 : end;
}

std::size_t JSONTokens::endOfString() const {
  std::size_t at = _at + 1;
  while (at < _text.size() && _text[at] != '"') at += _text[at] == '\\' ? 2 : 1;
  return std::min(at + 1, _text.size());
}

std::string textOfToken(std::string_view token) {
  if (token.find('\\') == std::string_view::npos) return std::string(token.substr(1, token.size() - 2));
  const auto value = parseJSON(token);
  const std::string* text = value ? value.value().asString() : nullptr;
  return text ? *text : std::string(token);
}

}  // namespace veltrad::formats
