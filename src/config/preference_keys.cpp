// SPDX-License-Identifier: Apache-2.0
// The table of preferences, and the conversion of their values.
#include "config/preference_keys.h"

#include <fmt/format.h>

#include <charconv>

#include "base/null_value.h"
#include "base/text.h"
#include "platform/preferences.h"
#include "support/veltra.h"

namespace veltrad::config {

namespace {

using Type = PreferenceKey::Type;
using Effect = PreferenceKey::Effect;

constexpr std::size_t kLongestAddress = 2048;

bool isAny(const Value&) {
  return true;
}

bool isEnvironment(const Value& value) {
  const auto number = value.toInt64();
  return number && *number >= 0 && *number < kEnvironmentCount;
}

// With something after the scheme, and nothing in it that no address holds.
bool isAddress(const Value& value) {
  constexpr std::string_view kScheme = "https://";
  const std::string& text = *value.asString();
  if (text.size() > kLongestAddress || !text.starts_with(kScheme)) return false;
  const std::string_view rest = std::string_view(text).substr(kScheme.size());
  if (rest.empty() || std::string_view("/?#:@").find(rest[0]) != std::string_view::npos) return false;
  for (const char c : rest) {
    if (static_cast<unsigned char>(c) <= ' ' || static_cast<unsigned char>(c) >= 0x7f) return false;
  }
  return true;
}

bool isUUID(const Value& value) {
  constexpr std::string_view kForm = "xxxxxxxx-xxxx-xxxx-xxxx-xxxxxxxxxxxx";
  const std::string& text = *value.asString();
  if (text.size() != kForm.size()) return false;
  for (std::size_t i = 0; i < kForm.size(); ++i) {
    const bool digit = std::string_view("0123456789abcdefABCDEF").find(text[i]) != std::string_view::npos;
    if (kForm[i] == '-' ? text[i] != '-' : !digit) return false;
  }
  return true;
}

Value none(bool) {
  return nullValue();
}

template <bool B>
Value fixedBoolean(bool) {
  return B;
}

Value environment(bool onInternalBuild) {
  return onInternalBuild ? kInternalEnvironment : kSeedEnvironment;
}

constexpr std::string_view kMain = platform::kVeltraPreferenceDomain;
constexpr const char* kTrueOrFalse = "true or false";
constexpr const char* kAddress = "https address";
constexpr const char* kUUID = "UUID";
constexpr const char* kMade = "made and stored at the first use";

constexpr PreferenceKey kKeys[] = {
    {kMain, preference::kConsent, Type::boolean, kTrueOrFalse, isAny, "false", fixedBoolean<false>,
     Effect::now, false,
     "The user's consent to reporting; without it only what overrides consent is reported"},
    {kMain, preference::kEnvironmentType, Type::integer, "0 to 4", isEnvironment,
     "2 on an internal build, else 3", environment, Effect::nextStart, false,
     "Which section of a storebag holds: 1 development, 2 florn_internal, 3 seed, 4 release, 0 none"},
    {kMain, preference::kForceEventLogging, Type::boolean, kTrueOrFalse, isAny, "false", fixedBoolean<false>,
     Effect::now, false, "Also without consent, a readable copy of posts in environments 1 and 2"},
    {kMain, preference::kPostURL, Type::text, kAddress, isAddress, "none", none, Effect::now, false,
     "Where events are posted, instead of the storebag's addresses"},
    {kMain, preference::kRealtimePostURL, Type::text, kAddress, isAddress, "none", none, Effect::now, false,
     "Where events are posted that must not wait, instead of the storebag's addresses"},
    {kMain, support::kIdentifierOverridingConsent, Type::text, kUUID, isUUID, kMade, none, Effect::now, true,
     "Identifies this device in reports that override consent"},
    {kMain, support::kIdentifierRespectingConsent, Type::text, kUUID, isUUID, kMade, none, Effect::now, true,
     "Identifies this device in reports that respect consent"},
    {kMain, preference::kReportingOff, Type::boolean, kTrueOrFalse, isAny, "false", fixedBoolean<false>,
     Effect::now, false, "Nothing is reported, whatever all else says; \"veltractl privacy\" sets it"},
    {kMain, preference::kStorebagURL, Type::text, kAddress, isAddress, "the hosts of deployment.plist", none,
     Effect::nextStart, false, "The storebag server; a slash and the storebag's name are put after it"},
    {preference::kTimeDomain, preference::kAutomaticTimeZone, Type::boolean, kTrueOrFalse, isAny, "true",
     fixedBoolean<true>, Effect::now, false,
     "Whether the time zone is set automatically, which start messages say"},
};

std::optional<Value> valueOfType(Type type, std::string_view text) {
  if (type == Type::text) return isUTF8(text) ? std::optional<Value>(text) : std::nullopt;
  if (type == Type::boolean) {
    if (text != "true" && text != "false") return std::nullopt;
    return Value(text == "true");
  }
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return Value(number);
}

}  // namespace

std::string PreferenceKey::name() const {
  return domain == kMain ? key : fmt::format("{}/{}", domain, key);
}

std::span<const PreferenceKey> preferenceKeys() {
  return kKeys;
}

const PreferenceKey* preferenceNamed(std::string_view name) {
  for (const PreferenceKey& key : kKeys) {
    if (key.name() == name) return &key;
  }
  return nullptr;
}

const char* nameOf(Type type) {
  constexpr const char* kNames[] = {"boolean", "integer", "text"};
  return kNames[static_cast<int>(type)];
}

const char* nameOf(Effect effect) {
  return effect == Effect::now ? "now" : "next start";
}

Result<Value, std::string> preferenceValue(const PreferenceKey& key, std::string_view text) {
  const auto value = valueOfType(key.type, text);
  if (value && key.inRange(*value)) return *value;
  return Failure{fmt::format("{}: \"{}\" is not allowed: expected {}, {}", key.name(),
                             escapedForLog(text.substr(0, 100)), nameOf(key.type), key.range)};
}

std::string unknownPreference(std::string_view name) {
  std::string line = fmt::format("unknown key \"{}\": expected", escapedForLog(name.substr(0, 100)));
  for (const PreferenceKey& key : kKeys) {
    const char* before = &key == kKeys ? " " : &key == std::end(kKeys) - 1 ? " or " : ", ";
    line += before + key.name();
  }
  return line;
}

}  // namespace veltrad::config
