// The HTTPS post backend: construction, and whether and how it reports for the current client.
#include "backends/https/https_post_backend.h"
#include "backends/https/text_lists.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "protocol/constants.h"
#include "protocol/veltra.h"

namespace veltrad {

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
    const BackendServices& services, const std::string& name, const Dictionary* profile,
    const std::optional<std::string>& productFamily) {
  if (!profile || !productFamily) return nullptr;
  if (!profile->array("clients")) {
    logError("HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(services, name, *profile, *productFamily));
}

HTTPSPostBackend::HTTPSPostBackend(const BackendServices& services, const std::string& name,
                                   const Dictionary& profile, const std::string& productFamily)
    : VeltraBackend(name, profile, productFamily, services.random),
      _services(services),
      _dnuEnabled(diagnosticLogSubmissionEnabled(services.preferences)),
      _forceEventLogging(
          textMeansYes(services.preferences.text(platform::kVeltraPreferenceDomain, "forceEventLogging"))),
      _uuidRespectDnu(services.library.getPersistentIdentifierForDNU(true)),
      _uuidOverrideDnu(services.library.getPersistentIdentifierForDNU(false)) {
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
  setDisplayURL(optionalText(profile.string("display_url")));
}

void HTTPSPostBackend::updateState() {
  setState(updateBackendState());
}

std::int32_t HTTPSPostBackend::updateBackendState() {
  const Array* clients = profile().array("clients");
  if (!clients) return kBackendDisabled;
  const SharedDictionary userInfo = userInfoDict();
  applyExpedite(*clients, optionalText(userInfo ? userInfo->string(kVeltraUserInfoClientName) : nullptr),
                optionalText(userInfo ? userInfo->string(kVeltraUserInfoServiceName) : nullptr));

  if (!requireUserInfo()) {
    const Dictionary* taken = nullptr;
    for (const Value& client : *clients) {
      const Dictionary* entry = client.asDictionary();
      if (entry && updatePostLink(*entry)) {
        taken = entry;
        break;
      }
    }
    resetBackendStateWithClient(taken);
    return kBackendReporting;
  }
  if (!userInfo) return kBackendWaiting;
  // Consent, lists, filters and sampling are not decided on yet, so nothing may be reported.
  logInfo("HTTPSPostBackend(updateBackendState): %s: clients that require user info are not served yet",
          name().c_str());
  _services.counters.count("back end disabled: clients that require user info are not served yet");
  return kBackendDisabled;
}

void HTTPSPostBackend::applyExpedite(const Array& clients, const std::optional<std::string>& clientName,
                                     const std::optional<std::string>& serviceName) {
  for (const Value& client : clients) {
    const Dictionary* entry = client.asDictionary();
    if (!entry || !matchClientNameAndServiceID(*entry, clientName, serviceName)) continue;
    if (const auto expedite = entry->real("expedite")) {
      setBatchEvents(*expedite == 0);
      logDebug("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d", batchEvents());
    }
    return;
  }
}

bool HTTPSPostBackend::updatePostLink(const Dictionary& entry) {
  bool changed = false;
  if (!(_useDefaultPostURL && _postURL)) {
    _useDefaultPostURL = false;
    if (const std::string* url = entry.string("post_url")) {
      _postURL = *url;
      logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for postURL", url->c_str());
      changed = true;
    }
  }
  if (_useDefaultRealtimePostURL && _realtimePostURL) return changed;
  _useDefaultRealtimePostURL = false;
  if (const std::string* url = entry.string("realtime_post_url")) {
    _realtimePostURL = *url;
    logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for realtimePostURL", url->c_str());
  } else {
    _realtimePostURL = _postURL;
    logDebug("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '%s'",
             _postURL ? _postURL->c_str() : "(null)");
  }
  return changed;
}

void HTTPSPostBackend::resetBackendStateWithClient(const Dictionary* entry) {
  _eventThreshold = entry ? entry->int32("event_threshold").value_or(0) : 0;
  logDebug("resetBackendStateWithClient: event_threshold set to %d", _eventThreshold);
  _extrasOnInternal = entry ? entry->int32("extras_on_internal").value_or(0) : 0;
  logDebug("setBackendStateWithClient: extras on internal is set to %d", _extrasOnInternal);
}

}  // namespace veltrad
