// SPDX-License-Identifier: Apache-2.0
// Applies the decision on a client entry to the back end.
#include "backends/https/https_post_state.h"

#include <algorithm>

#include "backends/https/text_lists.h"
#include "formats/json.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
std::optional<std::string> optionalText(const std::string* text) {
  return text ? std::optional<std::string>(*text) : std::nullopt;
}
}  // namespace

StateVerdict HTTPSPostState::updateBackendState() {
  const auto facts = _backEnd.facts();
  const SharedDictionary& userInfo = facts->userInfo;
  const auto clientName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoClientName) : nullptr);
  const auto serviceName =
      optionalText(userInfo ? userInfo->string(wire::kVeltraUserInfoServiceName) : nullptr);
  const auto& clients = *_profile->clients;
  const auto entry = std::find_if(clients.begin(), clients.end(), [&](const config::ClientEntry& candidate) {
    return matchClientNameAndServiceID(candidate, clientName, serviceName);
  });
  const bool found = entry != clients.end();
  _match = found ? ClientMatch{static_cast<std::size_t>(entry - clients.begin())}
                 : nearestClient(clients, clientName, serviceName);
  if (found) applyExpedite(*entry);
  if (!facts->requireUserInfo) return reportForEveryone();
  if (!userInfo) {
    _match = {};
    return counted(kBackendWaiting, wire::Reason::waits_for_user_info);
  }
  if (!found) return counted(kBackendDisabled, wire::Reason::no_entry);
  // For log lines alone.
  const SharedDictionary& shown = facts->sentUserInfo;
  return reportForClient(*entry,
                         optionalText(shown ? shown->string(wire::kVeltraUserInfoClientName) : nullptr),
                         optionalText(shown ? shown->string(wire::kVeltraUserInfoServiceName) : nullptr));
}

StateVerdict HTTPSPostState::reportForEveryone() {
  const auto& clients = *_profile->clients;
  const auto taken =
      std::find_if(clients.begin(), clients.end(),
                   [this](const config::ClientEntry& candidate) { return _links.updatePostLink(candidate); });
  const bool none = taken == clients.end();
  _match = none ? ClientMatch() : ClientMatch{static_cast<std::size_t>(taken - clients.begin())};
  resetBackendStateWithClient(none ? nullptr : &*taken);
  return {kBackendReporting, wire::Reason::no_user_info_required};
}

StateVerdict HTTPSPostState::counted(std::int32_t state, wire::Reason reason) {
  _counters.count(reason);
  return {state, reason};
}

StateVerdict HTTPSPostState::reportForClient(const config::ClientEntry& entry,
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
  if (verdict.reason) {
    logRefusal(entry, verdict, country);
    _counters.count(*verdict.reason);
  }
  const wire::Reason reason = verdict.reason.value_or(wire::Reason::reports);
  if (!verdict.samplingReached) return {kBackendDisabled, reason};

  resetBackendStateWithClient(&entry);
  if (entry.customClientID && !_identity.takeCustomClientID(clientName, serviceName)) {
    return counted(kBackendDisabled, wire::Reason::no_identifier);
  }
  logDebug(
      "HTTPSPostBackend(updateBackendState): %s: client found %s:%s, state=%d, samplingFactor=%f, "
      "hierarchy=%d",
      _backEnd.name().c_str(), clientName ? clientName->c_str() : "(null)",
      serviceName ? serviceName->c_str() : "(null)", verdict.state, _backEnd.samplingFactor(),
      verdict.hierarchy);
  _links.updatePostLink(entry);
  return {verdict.state, reason};
}

void HTTPSPostState::logRefusal(const config::ClientEntry& entry, const ClientVerdict& verdict,
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
               _backEnd.productFamily().c_str(), printed(entry.deviceWhitelist).c_str());
      break;
    case wire::Reason::device_refused: {
      const auto hardwareType = _backEnd.facts()->device.hardwareType;
      logDebug("HTTPSPostBackend(updateBackendState): (%s) is in device blacklist %s",
               hardwareType ? hardwareType->c_str() : "(null)", printed(entry.deviceBlacklist).c_str());
      break;
    }
    case wire::Reason::no_filters:
      logWarning("HTTPSPostBackend(updateBackendState): filters are required.");
      break;
    default:
      break;
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

void HTTPSPostState::applyExpedite(const config::ClientEntry& entry) {
  if (!entry.expedite) return;
  _batchEvents = *entry.expedite == 0;
  logDebug("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d", *_batchEvents);
}

void HTTPSPostState::resetBackendStateWithClient(const config::ClientEntry* entry) {
  _eventThreshold = entry ? entry->eventThreshold : 0;
  logDebug("resetBackendStateWithClient: event_threshold set to %d", _eventThreshold);
  const std::int32_t extras = entry ? entry->extrasOnInternal : 0;
  _identity.setExtrasOnInternal(extras);
  logDebug("setBackendStateWithClient: extras on internal is set to %d", extras);
}

}  // namespace veltrad::backends
