// SPDX-License-Identifier: Apache-2.0
// Reads consent and identifiers from the preferences and the library.
#include "backends/https/post_identity.h"

#include <string_view>

#include "backends/session_facts.h"
#include "config/preference_keys.h"
#include "platform/log.h"
#include "platform/uuid.h"

namespace veltrad::backends {

namespace {
bool diagnosticLogSubmissionEnabled(platform::Preferences& preferences) {
  const auto consent = preferences.value(platform::kVeltraPreferenceDomain, config::preference::kConsent);
  return consent && consent->toBoolean().value_or(false);
}

// True if the text, after blanks, a sign and zeros, begins with Y, y, T, t or a digit from 1 to 9.
bool textMeansYes(const std::optional<std::string>& text) {
  if (!text) return false;
  std::size_t at = text->find_first_not_of(" \t\n\v\f\r");
  if (at == std::string::npos) return false;
  if ((*text)[at] == '+' || (*text)[at] == '-') ++at;
  at = text->find_first_not_of('0', at);
  if (at == std::string::npos) return false;
  return std::string_view("YyTt123456789").find((*text)[at]) != std::string_view::npos;
}
}  // namespace

PostIdentity::PostIdentity(const Sources& sources)
    : _preferences(sources.preferences),
      _settings(sources.settings),
      _library(sources.library),
      _forceEventLogging(textMeansYes(
          _preferences.text(platform::kVeltraPreferenceDomain, config::preference::kForceEventLogging))),
      _dnuEnabled(diagnosticLogSubmissionEnabled(_preferences)),
      _uuidRespectDnu(sources.library.getPersistentIdentifierForDNU(true).value_or("")),
      _uuidOverrideDnu(sources.library.getPersistentIdentifierForDNU(false).value_or("")) {}

void PostIdentity::renewIdentifiers() {
  if (auto made = _library.getPersistentIdentifierForDNU(true)) _uuidRespectDnu = std::move(*made);
  if (auto made = _library.getPersistentIdentifierForDNU(false)) _uuidOverrideDnu = std::move(*made);
  _uuidCustom.reset();
}

void PostIdentity::rereadConsent() {
  _dnuEnabled = diagnosticLogSubmissionEnabled(_preferences);
}

bool PostIdentity::takeCustomClientID(const std::optional<std::string>& clientName,
                                      const std::optional<std::string>& serviceName) {
  auto identifier = getPersistentIdentifierForCustomClientIDSuffix(clientName, serviceName);
  if (!identifier) return false;
  _uuidCustom = std::move(identifier);
  return true;
}

std::optional<std::string> PostIdentity::getPersistentIdentifierForCustomClientIDSuffix(
    const std::optional<std::string>& clientName, const std::optional<std::string>& serviceName) const {
  const std::string key = "uuid:" + clientName.value_or("") + ":" + serviceName.value_or("");
  auto value = _preferences.textOrStore(platform::kVeltraPreferenceDomain, key, platform::randomUUIDText);
  if (!value) return std::nullopt;
  logInfo("getPersistentIdentifierForCustomClientIDSuffix: The value for %s: %s", key.c_str(),
          value->c_str());
  return value;
}

const std::string& PostIdentity::clientIdentifier(const DeviceFacts& device) const {
  if (device.isInternal && _extrasOnInternal != 0) return device.udid;
  if (_uuidCustom) return *_uuidCustom;
  return _dnuType != 0 ? _uuidOverrideDnu : _uuidRespectDnu;
}

bool PostIdentity::loggingAllowed() const {
  if (_dnuType == 0 && _dnuEnabled) return true;
  if (!_forceEventLogging) return false;
  const std::uint32_t environment = _settings.currentEnvironment().value_or(0);
  return environment == 1 || environment == 2;
}

}  // namespace veltrad::backends
