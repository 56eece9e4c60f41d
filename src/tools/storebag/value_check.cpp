// SPDX-License-Identifier: Apache-2.0
// Checks type, range, names and addresses.
#include "storebag/value_check.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <iterator>
#include <utility>

#include "base/text.h"
#include "storebag/address_check.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyType;
using enum FindingName;

constexpr const char* kURL = "${url}";
constexpr const char* kDashboardPort = "${dashboardPort}";
constexpr const char* kStandIn = "https://lab.example";

// In the order of KeyType.
constexpr const char* kTypeTexts[] = {
    "a text",   "an address",   "a text of names",          "an array of texts", "an integer", "a number",
    "anything", "a dictionary", "an array of dictionaries", "true or false",     "a text"};
static_assert(std::size(kTypeTexts) == static_cast<std::size_t>(KeyType::choice) + 1);

bool isNumberText(const std::string& text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return error == std::errc() && end == text.data() + text.size();
}

bool isFraction(const Value& value) {
  const double* real = value.asReal();
  return real != nullptr && std::trunc(*real) != *real;
}

bool holdsTextsAlone(const Array& array) {
  return std::all_of(array.begin(), array.end(), [](const Value& item) { return item.asString(); });
}

// The names of an array as one text.
std::string joined(const Array& names) {
  std::string text;
  for (const Value& name : names) text += (text.empty() ? "" : ",") + *name.asString();
  return text;
}

std::string mendOfType(const Key& key, const Value& value) {
  const std::string* text = value.asString();
  const Array* array = value.asArray();
  const bool isNumber =
      key.type == KeyType::integer || key.type == KeyType::real || key.type == KeyType::presence;
  if (isNumber && text && text->find("${") != std::string::npos)
    return "veltra-lab alone puts a value there: write the value itself, or give --lab.";
  if (isNumber && text && isNumberText(*text)) return fmt::format("Write it without quotes: {}.", *text);
  if (key.type == KeyType::texts && text) return fmt::format("Put it into brackets: [{}].", quoted(*text));
  if (key.type == KeyType::names && array && !array->empty() && holdsTextsAlone(*array))
    return fmt::format("Write one text, with commas between the names: {}.", quoted(joined(*array)));
  if (key.type == KeyType::dictionaries && value.asDictionary()) return "Put it into brackets: [{…}].";
  return fmt::format("Write {}{}.", typeText(key.type), rangeText(key));
}

// Two letters or three digits, or in a list of texts of which one must occur in the code, a part of them.
bool fitsCountries(const std::string& name, bool whole) {
  const auto consistsOf = [&](int (*kind)(int), std::size_t length) {
    const bool fits = whole ? name.size() == length : name.size() <= length;
    return fits && std::all_of(name.begin(), name.end(), [kind](unsigned char c) { return kind(c) != 0; });
  };
  return consistsOf(std::isalpha, 2) || consistsOf(std::isdigit, 3);
}

bool isCountry(const Key& key) {
  return key.name == std::string_view("locale_whitelist") || key.name == std::string_view("country");
}

class ValueCheck {
 public:
  // All outlive it.
  ValueCheck(LintSink& sink, const Spot& at, const Key& key, const Value& value)
      : _sink(sink), _at(at), _key(key), _value(value) {}

  void check(bool lab) const {
    const std::string* text = _value.asString();
    if (lab && text && *text == kDashboardPort && _key.type == KeyType::integer) return;
    if (!config::fits(_value, _key.type) || (_key.type == KeyType::integer && isFraction(_value)))
      return say(wrong_type,
                 fmt::format("\"{}\" is {}, not {}{}, and counts as absent", _key.name, shownValue(_value),
                             typeText(_key.type), rangeText(_key)),
                 mendOfType(_key, _value));
    switch (_key.type) {
      case KeyType::integer:
      case KeyType::real:
        return checkNumber();
      case KeyType::presence:
        return checkPresence();
      case KeyType::names:
        return checkNames();
      case KeyType::texts:
        return checkTexts(*_value.asArray());
      case KeyType::url:
        return checkAddress(*text, lab);
      case KeyType::text:
        return checkText(*text);
      default:
        return;
    }
  }

 private:
  void say(FindingName name, std::string message, std::string mend = {}) const {
    _sink.say(name, _at, std::move(message), std::move(mend));
  }

  void checkNumber() const {
    const config::Range& range = sensibleRange(_key);
    const double number = _value.toDouble().value_or(0);
    if (!isBounded(range) || (number >= range.least && number <= range.most)) return;
    const std::string expected = typeText(_key.type) + rangeText(_key);
    std::string mend = fmt::format("Write {}.", expected);
    if (range.most == 1 && number > 1 && number <= 100)
      mend = fmt::format("Write a share from 0 to 1: {:g} % is {:g}.", number, number / 100);
    say(out_of_range, fmt::format("\"{}\" is {}: expected {}", _key.name, shownValue(_value), expected),
        std::move(mend));
  }

  // Any value has an effect, but where numbers have a meaning, others are mistakes.
  void checkPresence() const {
    if (!isBounded(_key.range)) return;
    const double least = sensibleRange(_key).least;
    const std::string expected = fmt::format(
        "Write the period in milliseconds, {:.0f} or more; without the key there is none.", least);
    if (!_value.isNumber())
      say(_value.isBoolean() ? out_of_range : wrong_type,
          fmt::format("\"{}\" is {}, which switches it on with a period of 500 milliseconds", _key.name,
                      shownValue(_value)),
          _value.isBoolean() ? expected : mendOfType(_key, _value));
    else if (_value.toDouble().value_or(0) < least)
      say(out_of_range,
          fmt::format("\"{}\" is {}: expected a number of milliseconds{}", _key.name, shownValue(_value),
                      rangeText(_key)),
          expected);
  }

  void checkNames() const {
    std::vector<std::string> names;
    config::take(_key, _value, names);
    for (const std::string& name : names) checkName(name);
  }

  void checkTexts(const Array& texts) const {
    for (const Value& item : texts) {
      if (const std::string* text = item.asString())
        checkName(*text);
      else
        say(wrong_type,
            fmt::format("\"{}\" holds {}, which is no text and is passed over", _key.name, shownValue(item)),
            "Take it out, or put it into quotes.");
    }
  }

  // The name of a filtered field is compared whole, too.
  void checkText(const std::string& text) const {
    if (_key.name != std::string_view("key")) return;
    const std::string_view bare = trimmed(text);
    if (text.empty())
      say(empty_in_list, "\"key\" is empty, and no field has such a name",
          "Write the name of the field, or take the filter out.");
    else if (bare != text)
      say(blank_in_list,
          fmt::format("\"key\" is {} with a blank, which is part of the name: the field leaves in clear",
                      quoted(text)),
          fmt::format("Write {}.", quoted(std::string(bare))));
    else
      checkWildcard(text);
  }

  void checkWildcard(const std::string& name) const {
    if (name.find('*') != std::string::npos)
      say(wildcard,
          fmt::format("\"{}\" holds {}, which is compared letter by letter", _key.name, quoted(name)));
  }

  void checkName(const std::string& name) const {
    if (name.empty()) return say(empty_in_list, fmt::format("\"{}\" holds an empty text", _key.name));
    const std::string_view bare = trimmed(name);
    const bool anywhere = isCountry(_key) && name.find(' ') != std::string::npos;
    if (bare != name || anywhere)
      return say(
          blank_in_list,
          fmt::format("\"{}\" holds {} with a blank, which is part of the name", _key.name, quoted(name)),
          anywhere && bare == name ? "Put each country into quotes of its own: [\"US\", \"CA\"]."
                                   : fmt::format("Write {}.", quoted(std::string(bare))));
    if (isCountry(_key)) return checkCountry(name);
    checkWildcard(name);
  }

  void checkCountry(const std::string& name) const {
    const bool isThreshold = _key.name == std::string_view("country");
    if (!fitsCountries(name, isThreshold))
      return say(country_never_fits,
                 fmt::format("\"{}\" holds {}, and no locale has such a country", _key.name, quoted(name)));
    std::string capital = name;
    for (char& c : capital)
      if (c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
    if (capital == name) return;
    say(country_case,
        fmt::format("\"{}\" holds {}, and country codes have capital letters: {}", _key.name, quoted(name),
                    isThreshold ? "this threshold is never used"
                                : "here case does not matter, in \"country\" it does"),
        fmt::format("Write {}.", quoted(std::as_const(capital))));
  }

  void checkAddress(const std::string& address, bool lab) const {
    const bool hasPlaceholder = address.starts_with(kURL);
    const auto fault = faultOfAddress(
        lab && hasPlaceholder ? kStandIn + address.substr(std::string_view(kURL).size()) : address);
    if (!fault) return;
    say(fault->name, fmt::format("\"{}\" {} {}", _key.name, quoted(address), fault->what),
        hasPlaceholder && !lab
            ? "veltra-lab alone puts its address there: write that of your server, or give --lab."
            : fault->mend);
  }

  LintSink& _sink;
  const Spot& _at;
  const Key& _key;
  const Value& _value;
};

}  // namespace

const char* typeText(KeyType type) {
  return kTypeTexts[static_cast<std::size_t>(type)];
}

bool isBounded(const config::Range& range) {
  return range.least < range.most;
}

const config::Range& sensibleRange(const Key& key) {
  return isBounded(key.sensible) ? key.sensible : key.range;
}

std::string rangeText(const Key& key) {
  const config::Range& range = sensibleRange(key);
  if (!isBounded(range)) return "";
  if (range.most < config::kInt32.most) return fmt::format(" from {:.0f} to {:.0f}", range.least, range.most);
  return range.least > config::kInt32.least ? fmt::format(" of at least {:.0f}", range.least) : "";
}

void checkValue(LintSink& sink, bool lab, const Spot& at, const Key& key, const Value& value) {
  ValueCheck(sink, at, key, value).check(lab);
}

}  // namespace veltrad::storebag
