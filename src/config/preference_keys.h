// SPDX-License-Identifier: Apache-2.0
// One table of the preferences that the system reads, for reading, changing and describing them. Constants
// and pure functions; any thread.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::config {

// Names in the domain platform::kVeltraPreferenceDomain. Those of the identifiers are in support/veltra.h.
namespace preference {
inline constexpr const char* kConsent = "DiagnosticLogSubmissionEnabled";
inline constexpr const char* kEnvironmentType = "environmentType";
inline constexpr const char* kForceEventLogging = "forceEventLogging";
inline constexpr const char* kPostURL = "httpsPostURL";
inline constexpr const char* kRealtimePostURL = "httpsRealtimePostURL";
inline constexpr const char* kReportingOff = "ReportingOff";
inline constexpr const char* kStorebagURL = "veltra_storebag_url";
// In a domain of its own.
inline constexpr const char* kTimeDomain = "com.florn.timed";
inline constexpr const char* kAutomaticTimeZone = "TMAutomaticTimeZoneEnabled";
}  // namespace preference

// The number of values of ProcessSettings::currentEnvironment().
inline constexpr std::uint32_t kEnvironmentCount = 5;
inline constexpr std::uint32_t kInternalEnvironment = 2;
inline constexpr std::uint32_t kSeedEnvironment = 3;

struct PreferenceKey {
  enum class Type { boolean, integer, text };
  // When a change takes effect: for new sessions, or at the next start of the daemon.
  enum class Effect { now, nextStart };

  std::string_view domain;
  const char* key;  // in its domain's file
  Type type;
  const char* range;                            // for people: "0 to 4"
  bool (*inRange)(const Value&);                // of a value of the type
  const char* byDefault;                        // for people: what holds without the key
  Value (*defaultValue)(bool onInternalBuild);  // not a number: none that is fixed
  Effect effect;
  bool identifies;  // the device or its user: for its owner's eyes alone
  const char* meaning;

  // "environmentType", or "DOMAIN/KEY" of another domain.
  std::string name() const;
};

// In the order of their names, the main domain first.
std::span<const PreferenceKey> preferenceKeys();
// By name(). Null: there is none.
const PreferenceKey* preferenceNamed(std::string_view name);

const char* nameOf(PreferenceKey::Type type);      // "boolean", "integer", "text"
const char* nameOf(PreferenceKey::Effect effect);  // "now", "next start"

// As a person writes it. The error is one line that names key, type and range.
Result<Value, std::string> preferenceValue(const PreferenceKey& key, std::string_view text);

// One line for a name that preferenceNamed() does not know; it lists those that there are.
std::string unknownPreference(std::string_view name);

}  // namespace veltrad::config
