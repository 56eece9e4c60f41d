// SPDX-License-Identifier: Apache-2.0
// Reads JSON with RapidJSON's iterative parser, whose events become values directly.
#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include <charconv>

#include "base/base64.h"
#include "base/text.h"
#include "formats/json.h"
#include "formats/throwing_allocator.h"

namespace veltrad::formats {

namespace {

constexpr std::size_t kDepthLimit = 64;

// Receives RapidJSON's events and has the names of its interface. An event that returns false ends the
// parsing.
class Handler {
 public:
  bool Null() {
    if (_open.empty() || !_open.back().isDictionary) return fail("null outside an object");
    return true;
  }
  bool Bool(bool value) { return add(value); }
  // Numbers arrive as texts, because RapidJSON's own conversion fails for 0e300; the other events never
  // occur.
  bool Int(int) { return false; }
  bool Uint(unsigned) { return false; }
  bool Int64(std::int64_t) { return false; }
  bool Uint64(std::uint64_t) { return false; }
  bool Double(double) { return false; }
  bool RawNumber(const char* text, rapidjson::SizeType length, bool) {
    const char* end = text + length;
    std::int64_t asSigned = 0;
    if (const auto [stop, error] = std::from_chars(text, end, asSigned);
        error == std::errc() && stop == end) {
      return add(asSigned);
    }
    std::uint64_t asUnsigned = 0;
    if (const auto [stop, error] = std::from_chars(text, end, asUnsigned);
        error == std::errc() && stop == end) {
      return add(asUnsigned);
    }
    double real = 0;
    if (std::from_chars(text, end, real).ec != std::errc()) return fail("a number beyond the range of reals");
    return add(real);
  }
  bool String(const char* text, rapidjson::SizeType length, bool) {
    return isText({text, length}) && add(std::string(text, length));
  }

  bool StartObject() { return open(true); }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    _open.back().key.assign(text, length);
    return isText({text, length});
  }
  bool EndObject(rapidjson::SizeType) {
    // Repeated keys are merged before the special keys are looked for.
    Dictionary dictionary = Dictionary::fromEntries(std::move(_open.back().entries));
    _open.pop_back();
    if (dictionary.size() != 1) return add(std::move(dictionary));
    const auto& [key, value] = *dictionary.begin();
    if (key == "$date") {
      const auto seconds = value.isNumber() ? value.toDouble() : std::nullopt;
      return seconds ? add(Date{*seconds}) : fail("\"$date\" holds no number");
    }
    if (key == "$data") {
      auto bytes = value.asString() ? decodeBase64(*value.asString()) : std::nullopt;
      return bytes ? add(Data{std::move(*bytes)}) : fail("\"$data\" holds no base64");
    }
    return add(std::move(dictionary));
  }
  bool StartArray() { return open(false); }
  bool EndArray(rapidjson::SizeType) {
    Array array = std::move(_open.back().array);
    _open.pop_back();
    return add(std::move(array));
  }

  std::optional<Value> takeValue() { return std::move(_value); }
  const std::string& failure() const { return _failure; }

 private:
  struct Open {
    bool isDictionary;
    Array array;
    std::vector<Dictionary::Entry> entries;
    std::string key;
  };

  // RapidJSON accepts the second half of a surrogate pair without the first.
  bool isText(std::string_view text) { return isUTF8(text) || fail("half of a surrogate pair"); }
  bool fail(std::string what) {
    _failure = std::move(what);
    return false;
  }
  bool open(bool isDictionary) {
    if (_open.size() == kDepthLimit) return fail(fmt::format("nested deeper than {}", kDepthLimit));
    _open.push_back({isDictionary, {}, {}, {}});
    return true;
  }
  // If it were inline, GCC 12 would warn about uninitialised members of moved values.
  [[gnu::noinline]] bool add(Value value) {
    if (_open.empty()) {
      _value = std::move(value);
    } else if (Open& open = _open.back(); open.isDictionary) {
      open.entries.emplace_back(std::move(open.key), std::move(value));
    } else {
      open.array.push_back(std::move(value));
    }
    return true;
  }

  std::vector<Open> _open;
  std::optional<Value> _value;
  std::string _failure;
};

constexpr unsigned kStrict = rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag |
                             rapidjson::kParseNumbersAsStringsFlag;

template <unsigned kFlags>
Result<Value, JSONError> parse(std::string_view text) {
  Handler handler;
  rapidjson::GenericReader<rapidjson::UTF8<>, rapidjson::UTF8<>, ThrowingAllocator> reader;
  rapidjson::MemoryStream stream(text.data(), text.size());
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, handler);
  if (result.IsError()) {
    const std::string& failure = handler.failure();
    return Failure{
        JSONError{result.Offset(), failure.empty() ? rapidjson::GetParseError_En(result.Code()) : failure}};
  }
  // The stream ends at a zero byte.
  if (stream.Tell() != text.size()) {
    return Failure{JSONError{stream.Tell(), "more text after the value"}};
  }
  return std::move(*handler.takeValue());
}

}  // namespace

Result<Value, JSONError> parseJSON(std::string_view text) {
  return parse<kStrict>(text);
}

Result<Value, JSONError> parseJSONWithComments(std::string_view text) {
  return parse<kStrict | rapidjson::kParseCommentsFlag>(text);
}

}  // namespace veltrad::formats
