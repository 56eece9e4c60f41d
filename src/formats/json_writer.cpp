// SPDX-License-Identifier: Apache-2.0
// Writes values as JSON, indents compact JSON, and shortens texts for the log.
#include <rapidjson/writer.h>

#include <cmath>

#include "base/base64.h"
#include "base/text.h"
#include "formats/json.h"
#include "formats/json_text_writer.h"
#include "formats/throwing_allocator.h"

namespace veltrad::formats {

namespace {

// A RapidJSON stream that keeps the first bytes and counts the others.
class ExcerptStream {
 public:
  using Ch = char;
  ExcerptStream(JSONExcerpt& out, std::size_t most) : _out(out), _most(most) {}
  void Put(char c) {
    if (_out.text.size() < _most) {
      _out.text.push_back(c);
    } else {
      ++_out.leftOut;
    }
  }
  void Flush() {}

 private:
  JSONExcerpt& _out;
  const std::size_t _most;
};

// Writes to an excerpt.
class ExcerptWriter
    : public rapidjson::Writer<ExcerptStream, rapidjson::UTF8<>, rapidjson::UTF8<>, ThrowingAllocator> {
 public:
  using Writer::Writer;
  void String(std::string_view text) {
    if (!isUTF8(text)) return String(toUTF8(text));
    Writer::String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }
  void Key(std::string_view text) { String(text); }
};

template <typename Writer>
void putReal(Writer& writer, double number) {
  if (std::isfinite(number)) {
    writer.Double(number);
  } else {
    writer.Null();
  }
}

template <typename Writer>
void put(Writer& writer, const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
      writer.Bool(*value.toBoolean());
      return;
    case Value::Type::signedInteger:
      writer.Int64(*value.asSigned());
      return;
    case Value::Type::unsignedInteger:
      writer.Uint64(*value.asUnsigned());
      return;
    case Value::Type::real:
      return putReal(writer, *value.asReal());
    case Value::Type::string:
      return writer.String(*value.asString());
    case Value::Type::date:
      writer.StartObject();
      writer.Key("$date");
      putReal(writer, value.asDate()->secondsSince1970);
      writer.EndObject();
      return;
    case Value::Type::data:
      writer.StartObject();
      writer.Key("$data");
      writer.String(encodeBase64(value.asData()->bytes));
      writer.EndObject();
      return;
    case Value::Type::array:
      writer.StartArray();
      for (const Value& element : *value.asArray()) put(writer, element);
      writer.EndArray();
      return;
    case Value::Type::dictionary:
      writer.StartObject();
      for (const auto& [key, held] : *value.asDictionary()) {
        writer.Key(key);
        put(writer, held);
      }
      writer.EndObject();
      return;
  }
}

}  // namespace

void putValue(JSONTextWriter& writer, const Value& value) {
  put(writer, value);
}

std::string writeJSON(const Value& value, JSONStyle style) {
  std::string text;
  {
    JSONTextWriter writer(text);
    put(writer, value);
  }
  if (style == JSONStyle::compact) return text;
  std::string readable;
  JSONIndenter(readable).add(text);
  return readable;
}

void JSONIndenter::add(std::string_view compact) {
  while (!compact.empty()) {
    if (_inText) {
      addText(compact);
      continue;
    }
    const char c = compact.front();
    compact.remove_prefix(1);
    const bool closes = c == '}' || c == ']';
    if (closes) --_depth;
    // An empty object or array stays on its line.
    if (closes ? !_opened : _opened) newLine();
    _opened = c == '{' || c == '[';
    if (_opened) ++_depth;
    _inText = c == '"';
    _out.push_back(c);
    if (c == ':') _out.push_back(' ');
    if (c == ',') newLine();
  }
}

// Copies up to the quote that ends the text, unless the text goes on in the next piece.
void JSONIndenter::addText(std::string_view& compact) {
  std::size_t end = 0;
  for (; end < compact.size() && (_escaped || compact[end] != '"'); ++end)
    _escaped = !_escaped && compact[end] == '\\';
  _inText = end == compact.size();
  if (!_inText) ++end;
  _out.append(compact.substr(0, end));
  compact.remove_prefix(end);
}

void JSONIndenter::newLine() {
  constexpr std::size_t kIndent = 2;
  _out.append(1, '\n').append(kIndent * _depth, ' ');
}

JSONExcerpt excerptOfJSON(const Value& value, std::size_t most) {
  JSONExcerpt out;
  ExcerptStream stream(out, most);
  ExcerptWriter writer(stream);
  put(writer, value);
  const std::size_t whole = out.leftOut > 0 ? withoutIncompleteEnd(out.text).size() : out.text.size();
  out.leftOut += out.text.size() - whole;
  out.text.resize(whole);
  return out;
}

}  // namespace veltrad::formats
