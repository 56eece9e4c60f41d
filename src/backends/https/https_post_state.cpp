// The HTTPS post backend: construction, and whether and how it reports for the current client.
#include "backends/https/https_post_backend.h"

#include <algorithm>

#include "backends/https/text_lists.h"
#include "formats/json.h"
#include "platform/counters.h"
#include "platform/locale.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "platform/uuid.h"
#include "support/veltra.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
bool diagnosticLogSubmissionEnabled(platform::Preferences& preferences) {
  const auto consent = preferences.value(platform::kVeltraPreferenceDomain, "DiagnosticLogSubmissionEnabled");
  return consent && consent->toBoolean().value_or(false);
}

std::optional<std::string> optionalText(const std::string* text) {
  return text ? std::optional<std::string>(*text) : std::nullopt;
}
}  // namespace

bool textMeansYes(const std::optional<std::string>& text) {
  if (!text) return false;
  std::size_t at = text->find_first_not_of(" \t\n\v\f\r");
  if (at == std::string::npos) return false;
  if ((*text)[at] == '+' || (*text)[at] == '-') ++at;
  at = text->find_first_not_of('0', at);
  if (at == std::string::npos) return false;
  return std::string_view("YyTt123456789").find((*text)[at]) != std::string_view::npos;
}

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::initWithName(
    const BackendServices& services, PostErrors& errors, const std::string& name,
    std::shared_ptr<const config::HTTPSPostProfile> profile,
    const std::optional<std::string>& productFamily) {
  if (!profile || !productFamily) return nullptr;
  if (!profile->clients) {
    logError("HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  std::shared_ptr<HTTPSPostBackend> made(
      new HTTPSPostBackend(services, errors, name, std::move(profile), *productFamily));
  if (made->_uuidRespectDnu.empty() || made->_uuidOverrideDnu.empty()) {
    logError("HTTPSPostBackend(initWithName): the device's identifiers cannot be read just now.");
    return nullptr;
  }
  return made;
}

HTTPSPostBackend::HTTPSPostBackend(const BackendServices& services, PostErrors& errors,
                                   const std::string& name,
                                   std::shared_ptr<const config::HTTPSPostProfile> profile,
                                   const std::string& productFamily)
    : VeltraBackend(name, productFamily, services.random),
      _services(services),
      _profile(std::move(profile)),
      _errors(errors),
      _dnuEnabled(diagnosticLogSubmissionEnabled(services.preferences)),
      _forceEventLogging(
          textMeansYes(services.preferences.text(platform::kVeltraPreferenceDomain, "forceEventLogging"))),
      _uuidRespectDnu(services.library.getPersistentIdentifierForDNU(true).value_or("")),
      _uuidOverrideDnu(services.library.getPersistentIdentifierForDNU(false).value_or("")),
      _held(std::make_shared<HeldEvents>(services.counters)) {
  _postURL = services.preferences.text(platform::kVeltraPreferenceDomain, "httpsPostURL");
  if (_postURL)
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for postURL", _postURL->c_str());
  _useDefaultPostURL = _postURL.has_value();
  _realtimePostURL = services.preferences.text(platform::kVeltraPreferenceDomain, "httpsRealtimePostURL");
  if (_realtimePostURL) {
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for realtimePostURL",
             _realtimePostURL->c_str());
  }
  _useDefaultRealtimePostURL = _realtimePostURL.has_value();
  setDisplayURL(_profile->displayURL);
}

void HTTPSPostBackend::updateState() {
  setState(updateBackendState());
}

std::int32_t HTTPSPostBackend::updateBackendState() {
  const SharedDictionary userInfo = userInfoDict();
  const auto clientName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoClientName) : nullptr);
  const auto serviceName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoServiceName) : nullptr);
  const auto& clients = *_profile->clients;
  const auto entry = std::find_if(clients.begin(), clients.end(), [&](const config::ClientEntry& candidate) {
    return matchClientNameAndServiceID(candidate, clientName, serviceName);
  });
  const bool found = entry != clients.end();
  if (found) applyExpedite(*entry);
  if (!requireUserInfo()) return reportForEveryone();
  if (!userInfo) {
    _services.counters.count(wire::Reason::waits_for_user_info);
    return kBackendWaiting;
  }
  if (!found) {
    _services.counters.count(wire::Reason::no_entry);
    return kBackendDisabled;
  }
  return reportForClient(*entry, clientName, serviceName);
}

std::int32_t HTTPSPostBackend::reportForEveryone() {
  const auto& clients = *_profile->clients;
  const auto taken =
      std::find_if(clients.begin(), clients.end(),
                   [this](const config::ClientEntry& candidate) { return updatePostLink(candidate); });
  resetBackendStateWithClient(taken == clients.end() ? nullptr : &*taken);
  return kBackendReporting;
}

std::int32_t HTTPSPostBackend::reportForClient(const config::ClientEntry& entry,
                                               const std::optional<std::string>& clientName,
                                               const std::optional<std::string>& serviceName) {
  const auto country = _services.locale.countryCode();
  const ClientVerdict verdict =
      decideOnClient(entry, {_dnuEnabled, country, productFamily(), hardwareType(), samplingFactor()});
  setHierarchy(verdict.hierarchy);
  _dnuType = verdict.dnuType;
  if (verdict.filters) _filters.createFiltersFromArray(*verdict.filters);
  if (verdict.samplingReached) takeSampling(verdict, country);
  if (verdict.reason) {
    logRefusal(entry, verdict, country);
    _services.counters.count(*verdict.reason);
  }
  if (!verdict.samplingReached) return kBackendDisabled;

  resetBackendStateWithClient(&entry);
  if (entry.customClientID) {
    auto identifier = getPersistentIdentifierForCustomClientIDSuffix(clientName, serviceName);
    if (!identifier) {  // another would be no better than a wrong one
      _services.counters.count(wire::Reason::no_identifier);
      return kBackendDisabled;
    }
    _uuidCustom = std::move(identifier);
  }
  logDebug(
      "HTTPSPostBackend(updateBackendState): %s: client found %s:%s, state=%d, samplingFactor=%f, "
      "hierarchy=%d",
      name().c_str(), clientName ? clientName->c_str() : "(null)",
      serviceName ? serviceName->c_str() : "(null)", verdict.state, samplingFactor(), verdict.hierarchy);
  updatePostLink(entry);
  return verdict.state;
}

void HTTPSPostBackend::logRefusal(const config::ClientEntry& entry, const ClientVerdict& verdict,
                                  const std::optional<std::string>& country) const {
  const auto printed = [](const config::TextList& list) {
    return list.asGiven ? formats::writeJSON(*list.asGiven) : std::string("(null)");
  };
  switch (*verdict.reason) {
    case wire::Reason::no_consent:
      logDebug("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: %d.", verdict.overrideDNU);
      break;
    case wire::Reason::country_not_listed:
      logDebug("HTTPSPostBackend(updateBackendState): (%s) isn't in country code list %s",
               country ? country->c_str() : "(null)", printed(entry.localeWhitelist).c_str());
      break;
    case wire::Reason::device_not_listed:
      logDebug("HTTPSPostBackend(updateBackendState): (%s) isn't in device whitelist %s",
               productFamily().c_str(), printed(entry.deviceWhitelist).c_str());
      break;
    case wire::Reason::device_refused:
      logDebug("HTTPSPostBackend(updateBackendState): (%s) is in device blacklist %s",
               hardwareType() ? hardwareType()->c_str() : "(null)", printed(entry.deviceBlacklist).c_str());
      break;
    case wire::Reason::no_filters:
      logWarning("HTTPSPostBackend(updateBackendState): filters are required.");
      break;
    default:
      break;  // the line of the state says it
  }
}

void HTTPSPostBackend::takeSampling(const ClientVerdict& verdict, const std::optional<std::string>& country) {
  if (verdict.countryThreshold) {
    logDebug("HTTPSPostBackend(updateBackendState): sampling threshold for %s changed from %.02f to %.02f",
             country ? country->c_str() : "(null)", verdict.thresholdBefore.value_or(0),
             verdict.threshold.value_or(0));
  }
  setSamplingThreshold(verdict.threshold);
  if (verdict.overrideReached) _overrideSampling = verdict.overrideSampling;
}

std::optional<std::string> HTTPSPostBackend::getPersistentIdentifierForCustomClientIDSuffix(
    const std::optional<std::string>& clientName, const std::optional<std::string>& serviceName) const {
  const std::string key = "uuid:" + clientName.value_or("") + ":" + serviceName.value_or("");
  auto value =
      _services.preferences.textOrStore(platform::kVeltraPreferenceDomain, key, platform::randomUUIDText);
  if (!value) return std::nullopt;
  logInfo("getPersistentIdentifierForCustomClientIDSuffix: The value for %s: %s", key.c_str(),
          value->c_str());
  return value;
}

void HTTPSPostBackend::applyExpedite(const config::ClientEntry& entry) {
  if (!entry.expedite) return;
  setBatchEvents(*entry.expedite == 0);
  logDebug("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d", batchEvents());
}

bool HTTPSPostBackend::updatePostLink(const config::ClientEntry& entry) {
  bool changed = false;
  if (!(_useDefaultPostURL && _postURL)) {
    _useDefaultPostURL = false;
    if (entry.postURL) {
      _postURL = entry.postURL;
      logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for postURL", _postURL->c_str());
      changed = true;
    }
  }
  if (_useDefaultRealtimePostURL && _realtimePostURL) return changed;
  _useDefaultRealtimePostURL = false;
  if (entry.realtimePostURL) {
    _realtimePostURL = entry.realtimePostURL;
    logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for realtimePostURL",
             _realtimePostURL->c_str());
  } else {
    _realtimePostURL = _postURL;
    logDebug("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '%s'",
             _postURL ? _postURL->c_str() : "(null)");
  }
  return changed;
}

void HTTPSPostBackend::resetBackendStateWithClient(const config::ClientEntry* entry) {
  _eventThreshold = entry ? entry->eventThreshold : 0;
  logDebug("resetBackendStateWithClient: event_threshold set to %d", _eventThreshold);
  _extrasOnInternal = entry ? entry->extrasOnInternal : 0;
  logDebug("setBackendStateWithClient: extras on internal is set to %d", _extrasOnInternal);
}

}  // namespace veltrad::backends
