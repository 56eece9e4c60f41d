// Whether and how the back end reports for the current client.
#include "backends/https/https_post_state.h"

#include "backends/https/text_lists.h"
#include "formats/json.h"
#include "platform/counters.h"
#include "platform/locale.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
std::optional<std::string> optionalText(const std::string* text) {
  return text ? std::optional<std::string>(*text) : std::nullopt;
}
}  // namespace

std::int32_t HTTPSPostState::updateBackendState() {
  const Array* clients = _backEnd.profile().array("clients");
  if (!clients) return kBackendDisabled;
  const auto facts = _backEnd.facts();
  const SharedDictionary& userInfo = facts->userInfo;
  const auto clientName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoClientName) : nullptr);
  const auto serviceName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoServiceName) : nullptr);
  const Dictionary* entry = nullptr;
  for (const Value& client : *clients) {
    const Dictionary* candidate = client.asDictionary();
    if (!candidate || !matchClientNameAndServiceID(*candidate, clientName, serviceName)) continue;
    entry = candidate;
    break;
  }
  if (entry) applyExpedite(*entry);
  if (!facts->requireUserInfo) return reportForEveryone(*clients);
  if (!userInfo) {
    _counters.count("back end waiting: user info is required, and there is none");
    return kBackendWaiting;
  }
  if (!entry) {
    _counters.count("back end disabled: no client entry fits");
    return kBackendDisabled;
  }
  return reportForClient(*entry, clientName, serviceName);
}

std::int32_t HTTPSPostState::reportForEveryone(const Array& clients) {
  const Dictionary* taken = nullptr;
  for (const Value& client : clients) {
    const Dictionary* entry = client.asDictionary();
    if (!entry || !_links.updatePostLink(*entry)) continue;
    taken = entry;
    break;
  }
  resetBackendStateWithClient(taken);
  return kBackendReporting;
}

std::int32_t HTTPSPostState::reportForClient(const Dictionary& entry,
                                             const std::optional<std::string>& clientName,
                                             const std::optional<std::string>& serviceName) {
  const auto country = _locale.countryCode();
  const ClientVerdict verdict =
      decideOnClient(entry, {_identity.consent(), country, _backEnd.productFamily(),
                             _backEnd.facts()->device.hardwareType, _backEnd.samplingFactor()});
  _backEnd.setHierarchy(verdict.hierarchy);
  _identity.setDNUType(verdict.dnuType);
  if (verdict.filters) _filters.createFiltersFromArray(*verdict.filters);
  if (verdict.samplingReached) takeSampling(verdict, country);
  if (verdict.refusal != ClientRefusal::none) {
    logRefusal(entry, verdict, country);
    _counters.count(reasonOf(verdict.refusal));
  }
  if (verdict.state == kBackendHeld) _counters.count("back end held: sampled out, may be overridden");
  if (!verdict.samplingReached) return kBackendDisabled;

  resetBackendStateWithClient(&entry);
  if (entry.contains("custom_clientId") && !_identity.takeCustomClientID(clientName, serviceName)) {
    _counters.count("back end disabled: its client's identifier cannot be read");
    return kBackendDisabled;
  }
  logDebug(
      "HTTPSPostBackend(updateBackendState): %s: client found %s:%s, state=%d, samplingFactor=%f, "
      "hierarchy=%d",
      _backEnd.name().c_str(), clientName ? clientName->c_str() : "(null)",
      serviceName ? serviceName->c_str() : "(null)", verdict.state, _backEnd.samplingFactor(),
      verdict.hierarchy);
  _links.updatePostLink(entry);
  return verdict.state;
}

void HTTPSPostState::logRefusal(const Dictionary& entry, const ClientVerdict& verdict,
                                const std::optional<std::string>& country) const {
  const auto printed = [&entry](const char* key) {
    const Value* list = entry.find(key);
    return list ? formats::writeJSON(*list) : std::string("(null)");
  };
  switch (verdict.refusal) {
    case ClientRefusal::consentMissing:
      logDebug("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: %d.", verdict.overrideDNU);
      break;
    case ClientRefusal::countryNotListed:
      logDebug("HTTPSPostBackend(updateBackendState): (%s) isn't in country code list %s",
               country ? country->c_str() : "(null)", printed("locale_whitelist").c_str());
      break;
    case ClientRefusal::deviceNotListed:
      logDebug("HTTPSPostBackend(updateBackendState): (%s) isn't in device whitelist %s",
               _backEnd.productFamily().c_str(), printed("device_whitelist").c_str());
      break;
    case ClientRefusal::deviceListed: {
      const auto hardwareType = _backEnd.facts()->device.hardwareType;
      logDebug("HTTPSPostBackend(updateBackendState): (%s) is in device blacklist %s",
               hardwareType ? hardwareType->c_str() : "(null)", printed("device_blacklist").c_str());
      break;
    }
    case ClientRefusal::filtersMissing:
      logWarning("HTTPSPostBackend(updateBackendState): filters are required.");
      break;
    case ClientRefusal::none:
    case ClientRefusal::thresholdMissing:
    case ClientRefusal::sampledOut:
      break;  // the line of the state says it
  }
}

void HTTPSPostState::takeSampling(const ClientVerdict& verdict, const std::optional<std::string>& country) {
  if (verdict.countryThreshold) {
    logDebug("HTTPSPostBackend(updateBackendState): sampling threshold for %s changed from %.02f to %.02f",
             country ? country->c_str() : "(null)", verdict.thresholdBefore.value_or(0),
             verdict.threshold.value_or(0));
  }
  _backEnd.setSamplingThreshold(verdict.threshold);
  if (verdict.overrideReached) _overrideSampling = verdict.overrideSampling;
}

void HTTPSPostState::applyExpedite(const Dictionary& entry) {
  const auto expedite = entry.real("expedite");
  if (!expedite) return;
  _batchEvents = *expedite == 0;
  logDebug("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d", *_batchEvents);
}

void HTTPSPostState::resetBackendStateWithClient(const Dictionary* entry) {
  _eventThreshold = entry ? entry->int32("event_threshold").value_or(0) : 0;
  logDebug("resetBackendStateWithClient: event_threshold set to %d", _eventThreshold);
  const std::int32_t extras = entry ? entry->int32("extras_on_internal").value_or(0) : 0;
  _identity.setExtrasOnInternal(extras);
  logDebug("setBackendStateWithClient: extras on internal is set to %d", extras);
}

}  // namespace veltrad::backends
