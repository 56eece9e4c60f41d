// SPDX-License-Identifier: Apache-2.0
// Checks type, range, names and addresses.
#include "storebag/value_check.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <charconv>
#include <cmath>
#include <iterator>

#include "base/text.h"
#include "storebag/address_check.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyType;

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

void ValueCheck::check(const Spot& at, const Key& key, const Value& value) const {
  if (isPlaceholder(key, value)) return;
  if (!config::fits(value, key.type) || (key.type == KeyType::integer && isFraction(value)))
    return sayWrongType(at, key, value);
  switch (key.type) {
    case KeyType::integer:
    case KeyType::real:
      return checkNumber(at, key, value);
    case KeyType::presence:
      return checkPresence(at, key, value);
    case KeyType::names:
      return checkNames(at, key, *value.asString());
    case KeyType::texts:
      return checkTexts(at, key, *value.asArray());
    case KeyType::url:
      return checkAddress(at, key, *value.asString());
    case KeyType::text:
      return checkText(at, key, *value.asString());
    default:
      return;
  }
}

bool ValueCheck::isPlaceholder(const Key& key, const Value& value) const {
  const std::string* text = _lab ? value.asString() : nullptr;
  return text != nullptr && *text == kDashboardPort && key.type == KeyType::integer;
}

void ValueCheck::sayWrongType(const Spot& at, const Key& key, const Value& value) const {
  _sink.say(FindingName::wrong_type, at,
            fmt::format("\"{}\" is {}, not {}{}, and counts as absent", key.name, shownValue(value),
                        typeText(key.type), rangeText(key)),
            mendOfType(key, value));
}

void ValueCheck::sayNoDictionary(const Spot& at, const Value& value) const {
  _sink.say(FindingName::wrong_type, at,
            fmt::format("{} is no dictionary, and is passed over", shownValue(value)),
            "Take it out, or put a dictionary there.");
}

void ValueCheck::checkNumber(const Spot& at, const Key& key, const Value& value) const {
  const config::Range& range = sensibleRange(key);
  const double number = value.toDouble().value_or(0);
  if (!isBounded(range) || (number >= range.least && number <= range.most)) return;
  std::string mend = fmt::format("Write {}{}.", typeText(key.type), rangeText(key));
  if (range.most == 1 && number > 1 && number <= 100)
    mend = fmt::format("Write a share from 0 to 1: {:g} % is {:g}.", number, number / 100);
  _sink.say(FindingName::out_of_range, at,
            fmt::format("\"{}\" is {}: expected {}{}", key.name, shownValue(value), typeText(key.type),
                        rangeText(key)),
            std::move(mend));
}

// Any value has an effect, but where numbers have a meaning, others are mistakes.
void ValueCheck::checkPresence(const Spot& at, const Key& key, const Value& value) const {
  if (!isBounded(key.range)) return;
  const std::string expected =
      fmt::format("Write the period in milliseconds, {:.0f} or more; without the key there is none.",
                  sensibleRange(key).least);
  if (value.isBoolean())
    return _sink.say(FindingName::out_of_range, at,
                     fmt::format("\"{}\" is {}, which switches it on with a period of 500 milliseconds",
                                 key.name, shownValue(value)),
                     expected);
  if (!value.isNumber())
    return _sink.say(FindingName::wrong_type, at,
                     fmt::format("\"{}\" is {}, which switches it on with a period of 500 milliseconds",
                                 key.name, shownValue(value)),
                     mendOfType(key, value));
  if (value.toDouble().value_or(0) < sensibleRange(key).least)
    _sink.say(FindingName::out_of_range, at,
              fmt::format("\"{}\" is {}: expected a number of milliseconds{}", key.name, shownValue(value),
                          rangeText(key)),
              expected);
}

void ValueCheck::checkNames(const Spot& at, const Key& key, const std::string& text) const {
  std::vector<std::string> names;
  config::take(key, Value(text), names);
  for (const std::string& name : names) checkName(at, key, name);
}

void ValueCheck::checkTexts(const Spot& at, const Key& key, const Array& texts) const {
  for (const Value& item : texts) {
    const std::string* text = item.asString();
    if (text != nullptr) {
      checkName(at, key, *text);
    } else {
      _sink.say(
          FindingName::wrong_type, at,
          fmt::format("\"{}\" holds {}, which is no text and is passed over", key.name, shownValue(item)),
          "Take it out, or put it into quotes.");
    }
  }
}

// The name of a filtered field is compared whole, too.
void ValueCheck::checkText(const Spot& at, const Key& key, const std::string& text) const {
  if (key.name != std::string_view("key")) return;
  const std::string_view bare = trimmed(text);
  if (text.empty())
    _sink.say(FindingName::empty_in_list, at, "\"key\" is empty, and no field has such a name",
              "Write the name of the field, or take the filter out.");
  else if (bare != text)
    _sink.say(FindingName::blank_in_list, at,
              fmt::format("\"key\" is {} with a blank, which is part of the name: the field leaves in clear",
                          quoted(text)),
              fmt::format("Write {}.", quoted(std::string(bare))));
  else
    checkWildcard(at, key, text);
}

void ValueCheck::checkWildcard(const Spot& at, const Key& key, const std::string& name) const {
  if (name.find('*') != std::string::npos)
    _sink.say(FindingName::wildcard, at,
              fmt::format("\"{}\" holds {}, which is compared letter by letter", key.name, quoted(name)));
}

void ValueCheck::checkName(const Spot& at, const Key& key, const std::string& name) const {
  if (name.empty())
    return _sink.say(FindingName::empty_in_list, at, fmt::format("\"{}\" holds an empty text", key.name));
  const std::string_view bare = trimmed(name);
  const bool anywhere = isCountry(key) && name.find(' ') != std::string::npos;
  if (bare != name || anywhere)
    return _sink.say(
        FindingName::blank_in_list, at,
        fmt::format("\"{}\" holds {} with a blank, which is part of the name", key.name, quoted(name)),
        anywhere && bare == name ? "Put each country into quotes of its own: [\"US\", \"CA\"]."
                                 : fmt::format("Write {}.", quoted(std::string(bare))));
  if (!isCountry(key)) return checkWildcard(at, key, name);
  const bool isThreshold = key.name == std::string_view("country");
  if (!fitsCountries(name, isThreshold))
    return _sink.say(
        FindingName::country_never_fits, at,
        fmt::format("\"{}\" holds {}, and no locale has such a country", key.name, quoted(name)));
  const bool hasSmall = std::any_of(name.begin(), name.end(), [](char c) { return c >= 'a' && c <= 'z'; });
  if (!hasSmall) return;
  std::string capital = name;
  for (char& c : capital)
    if (c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
  _sink.say(FindingName::country_case, at,
            fmt::format("\"{}\" holds {}, and country codes have capital letters: {}", key.name, quoted(name),
                        isThreshold ? "this threshold is never used"
                                    : "here case does not matter, in \"country\" it does"),
            fmt::format("Write {}.", quoted(std::as_const(capital))));
}

void ValueCheck::checkAddress(const Spot& at, const Key& key, const std::string& address) const {
  const bool hasPlaceholder = address.starts_with(kURL);
  const auto fault = faultOfAddress(
      _lab && hasPlaceholder ? kStandIn + address.substr(std::string_view(kURL).size()) : address);
  if (!fault) return;
  _sink.say(fault->name, at, fmt::format("\"{}\" {} {}", key.name, quoted(address), fault->what),
            hasPlaceholder && !_lab
                ? "veltra-lab alone puts its address there: write that of your server, or give --lab."
                : fault->mend);
}

}  // namespace veltrad::storebag
