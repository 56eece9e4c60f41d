// SPDX-License-Identifier: Apache-2.0
// Finds wrong keys and values in a settings file, with their places. A pure function; any thread.
#include "config/settings_check.h"

#include <fmt/format.h>

#include <algorithm>

#include "formats/json.h"
#include "platform/local_settings.h"

namespace veltrad::config {
namespace {

// "refuse" or "a" or "b"
std::string choicesText(std::string_view choices) {
  std::string text = "\"";
  for (const char c : choices) text += c == '|' ? std::string("\" or \"") : std::string(1, c);
  return text + "\"";
}

bool isChoice(std::string_view choices, const std::string& text) {
  for (std::size_t at = 0; at <= choices.size();) {
    const std::size_t end = std::min(choices.find('|', at), choices.size());
    if (choices.substr(at, end - at) == text) return true;
    at = end + 1;
  }
  return false;
}

bool isWithin(const Range& range, const Value& value) {
  const double number = value.toDouble().value_or(0);
  return range.least >= range.most || (number >= range.least && number <= range.most);
}

std::string rangeText(const Range& range) {
  return range.least < range.most ? fmt::format(" from {} to {}", range.least, range.most) : "";
}

// The expected value as a text; absent if the value fits.
std::optional<std::string> expectedInstead(const Key& key, const Value& value) {
  const bool isInteger =
      value.type() == Value::Type::signedInteger || value.type() == Value::Type::unsignedInteger;
  const auto unless = [](bool fits, std::string text) {
    return fits ? std::nullopt : std::optional(std::move(text));
  };
  switch (key.type) {
    case KeyType::boolean:
      return unless(value.isBoolean(), "true or false");
    case KeyType::choice:
      return unless(value.asString() && isChoice(key.choices, *value.asString()), choicesText(key.choices));
    case KeyType::integer:
      return unless(isInteger && isWithin(key.range, value), "an integer" + rangeText(key.range));
    case KeyType::real:
      return unless((isInteger || value.asReal()) && isWithin(key.range, value),
                    "a number" + rangeText(key.range));
    case KeyType::texts: {
      const Array* array = value.asArray();
      return unless(array && std::all_of(array->begin(), array->end(),
                                         [](const Value& element) { return element.asString() != nullptr; }),
                    "an array of texts");
    }
    case KeyType::dictionary:
      return unless(value.asDictionary() != nullptr, "a dictionary");
    default:
      return unless(fits(value, key.type), "another type");
  }
}

class Check {
 public:
  explicit Check(const platform::LocalContent& content) : _content(content) {}

  void check(const Dictionary& dictionary, const KeyTable& table) {
    for (const auto& [name, value] : dictionary) {
      _path.push_back(name);
      if (const Key* key = table.find(name)) {
        checkValue(*key, value);
      } else {
        warn(fmt::format("unknown key {}: expected one of {}", quoted(name), namesOf(table)));
      }
      _path.pop_back();
    }
  }
  SettingsFindings take() { return std::move(_findings); }

 private:
  void checkValue(const Key& key, const Value& value) {
    if (const auto expected = expectedInstead(key, value)) {
      if (!_findings.error)
        _findings.error = fmt::format("{}: \"{}\" is {}: expected {}", _content.placeOf(_path), key.name,
                                      formats::excerptOfJSON(value, 80).text, *expected);
      return;
    }
    if (key.inner != nullptr) check(*value.asDictionary(), *key.inner);
  }
  void warn(const std::string& what) { _findings.warnings.push_back(_content.placeOf(_path) + ": " + what); }

  static std::string quoted(const std::string& text) { return formats::writeJSON(Value(text)); }
  static std::string namesOf(const KeyTable& table) {
    std::string names;
    for (const Key& key : table) names += (names.empty() ? "" : ", ") + std::string(key.name);
    return names;
  }

  const platform::LocalContent& _content;
  std::vector<std::string> _path;
  SettingsFindings _findings;
};

}  // namespace

SettingsFindings checkSettings(const platform::LocalContent& content, const KeyTable& table) {
  const Dictionary* dictionary = content.value.asDictionary();
  if (dictionary == nullptr) return {content.placeOf({}) + ": the outermost value is not a dictionary", {}};
  Check check(content);
  check.check(*dictionary, table);
  return check.take();
}

}  // namespace veltrad::config
