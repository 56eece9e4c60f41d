// Reads JSON: RapidJSON's events, without recursion, straight into values. Any thread.
#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>

#include "base/base64.h"
#include "base/json.h"

namespace veltrad {

namespace {

constexpr std::size_t kDepthLimit = 64;

// Takes RapidJSON's events; its operations have RapidJSON's names. An event that returns false ends the
// reading.
class Handler {
 public:
  bool Null() {
    if (_open.empty() || !_open.back().isDictionary) return fail("null outside an object");
    return true;  // the entry is left out
  }
  bool Bool(bool value) { return add(value); }
  bool Int(int value) { return add(value); }
  bool Uint(unsigned value) { return add(static_cast<std::int64_t>(value)); }
  bool Int64(std::int64_t value) { return add(value); }
  bool Uint64(std::uint64_t value) { return add(value); }
  bool Double(double value) { return add(value); }
  bool RawNumber(const char*, rapidjson::SizeType, bool) { return fail("a number as a text"); }
  bool String(const char* text, rapidjson::SizeType length, bool) { return add(std::string(text, length)); }

  bool StartObject() { return open(true); }
  bool Key(const char* text, rapidjson::SizeType length, bool) {
    _open.back().key.assign(text, length);
    return true;
  }
  bool EndObject(rapidjson::SizeType) {
    auto entries = std::move(_open.back().entries);
    _open.pop_back();
    if (entries.size() != 1) return add(Dictionary::fromEntries(std::move(entries)));
    const auto& [key, value] = entries.front();
    if (key == "$date") {
      const auto seconds = value.isNumber() ? value.toDouble() : std::nullopt;
      return seconds ? add(Date{*seconds}) : fail("\"$date\" holds no number");
    }
    if (key == "$data") {
      auto bytes = value.asString() ? decodeBase64(*value.asString()) : std::nullopt;
      return bytes ? add(Data{std::move(*bytes)}) : fail("\"$data\" holds no base64");
    }
    return add(Dictionary::fromEntries(std::move(entries)));
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

  bool fail(std::string what) {
    _failure = std::move(what);
    return false;
  }
  bool open(bool isDictionary) {
    if (_open.size() == kDepthLimit) return fail(fmt::format("nested deeper than {}", kDepthLimit));
    _open.push_back({isDictionary, {}, {}, {}});
    return true;
  }
  // Not inline: GCC 12 sees uninitialised members in moved values otherwise.
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

}  // namespace

Result<Value, JSONError> parseJSON(std::string_view text) {
  constexpr unsigned kFlags = rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag |
                              rapidjson::kParseFullPrecisionFlag;
  Handler handler;
  rapidjson::Reader reader;
  rapidjson::MemoryStream stream(text.data(), text.size());
  const rapidjson::ParseResult result = reader.Parse<kFlags>(stream, handler);
  if (result.IsError()) {
    const std::string& failure = handler.failure();
    return Failure{
        JSONError{result.Offset(), failure.empty() ? rapidjson::GetParseError_En(result.Code()) : failure}};
  }
  // The stream takes a zero byte for its end.
  if (stream.Tell() != text.size()) {
    return Failure{JSONError{stream.Tell(), "more text after the value"}};
  }
  return std::move(*handler.takeValue());
}

}  // namespace veltrad
