// SPDX-License-Identifier: Apache-2.0
// Computes the owner's decision. Any thread.
#include "config/owner_gate.h"

#include <algorithm>
#include <string>
#include <utility>

#include "base/null_value.h"
#include "config/preference_keys.h"
#include "platform/device_secret.h"
#include "platform/preferences.h"
#include "support/history.h"

namespace veltrad::config {

namespace {
// Absent if it cannot be read at the moment.
std::optional<bool> isTrue(platform::Preferences& preferences, const char* key) {
  const auto found = preferences.lookUp(platform::kVeltraPreferenceDomain, key);
  if (!found) return std::nullopt;
  return found.value() && found.value()->toBoolean().value_or(false);
}

std::string textOf(wire::Reason reason) {
  return std::string("The owner of the device does not let it leave (") +
         std::string(wire::entryOf(reason).name) + ")";
}

std::optional<support::HistorySpace> spaceOf(const std::optional<HistoryBounds>& bounds) {
  if (!bounds) return std::nullopt;
  const HistoryBounds byDefault;
  return support::HistorySpace{bounds->days,
                               static_cast<std::uint64_t>(bounds->bytes.value_or(*byDefault.bytes))};
}
}  // namespace

std::optional<wire::Reason> OwnerDecision::refusalFor(std::string_view backend,
                                                      const std::vector<std::string>& hosts) const {
  if (refusal) return refusal;
  if (!policy->makes(backend)) return wire::Reason::policy_backends;
  const bool reaches = hosts.empty() || std::any_of(hosts.begin(), hosts.end(), [this](const auto& host) {
                         return policy->reaches(host);
                       });
  return reaches ? std::nullopt : std::optional(wire::Reason::policy_hosts);
}

OwnerGate::OwnerGate(OwnerPolicy& policy, platform::Preferences& preferences, platform::DeviceSecret& secret,
                     DailyAllowance& allowance, Destinations* destinations, support::History* history)
    : _policy(policy),
      _preferences(preferences),
      _secret(secret),
      _allowance(allowance),
      _destinations(destinations),
      _history(history) {}

bool OwnerGate::refresh() {
  auto policy = _policy.current();
  const PolicyRules& rules = policy->rules();
  const auto off = isTrue(_preferences, preference::kReportingOff);
  const auto consent =
      rules.consent == ConsentRule::always ? isTrue(_preferences, preference::kConsent) : true;
  if (!off || !consent) return false;
  const auto refusal = *off ? wire::Reason::privacy_off : policy->refusal(*consent);
  const auto before = decision();
  // While it cannot be read, fields that are to be hashed are removed, so that the rest of the policy holds.
  const auto secret = rules.hash.texts.empty() ? std::nullopt : _secret.bytes();
  auto fields = before->fields;
  if (policy != before->policy || (fields && !fields->madeWith(secret))) {
    const bool has = !rules.remove.texts.empty() || !rules.hash.texts.empty();
    fields = has ? std::make_shared<const FieldRules>(rules, secret) : nullptr;
  }
  const std::uint64_t resets = _resets.load(std::memory_order_relaxed);
  if (policy == before->policy && fields == before->fields && refusal == before->refusal &&
      resets == before->resets)
    return false;
  if (_history && policy != before->policy) _history->keep(spaceOf(rules.history));
  auto decision = std::make_shared<const OwnerDecision>(
      OwnerDecision{std::move(policy), refusal, std::move(fields), resets});
  const Lock held(_mutex);
  _decision = std::move(decision);
  _turn.fetch_add(1, std::memory_order_release);
  return true;
}

std::shared_ptr<const OwnerDecision> OwnerGate::decision() const {
  const Lock held(_mutex);
  return _decision;
}

std::optional<http::RequestRefusal> OwnerGate::refusal(bool forStorebag, std::string_view host) const {
  const auto now = decision();
  auto reason = forStorebag ? std::nullopt : now->refusal;
  if (!reason && !now->policy->reaches(host)) reason = wire::Reason::policy_hosts;
  if (!reason) return std::nullopt;
  return http::RequestRefusal{*reason, textOf(*reason)};
}

std::optional<http::RequestRefusal> OwnerGate::count(const http::Departure& departure) {
  if (mayLeave(departure.events, departure.bytes)) {
    if (_destinations) _destinations->count(departure.kind, departure.to, departure.events, departure.bytes);
    return std::nullopt;
  }
  return http::RequestRefusal{wire::Reason::over_daily_limit, textOf(wire::Reason::over_daily_limit)};
}

bool OwnerGate::mayLeave(std::uint64_t events, std::uint64_t bytes) {
  return _allowance.take(decision()->policy->rules(), events, bytes);
}

void OwnerGate::datagramLeft(std::string_view to, std::uint64_t events, std::uint64_t bytes) {
  if (_destinations) _destinations->count(http::Departure::Kind::datagram, to, events, bytes);
}

bool OwnerGate::keepsRecords() const {
  return _history && _history->keeps();
}

bool OwnerGate::hasRoomForRecord() const {
  return !_history || _history->hasRoom();
}

std::uint64_t OwnerGate::record(const http::Departure& departure, std::vector<std::string> headerLines,
                                std::string_view body, std::shared_ptr<const FileDescriptor> file) {
  if (!keepsRecords()) return 0;
  constexpr const char* kKinds[] = {"post", "datagram", "file", "logData"};
  Dictionary header = departure.about;
  for (const char* key : {"clientType", "sessionID", "client", "service"})
    header.set(key, orNull(departure.client ? departure.client->find(key) : nullptr));
  for (const char* key : {"backend", "storebag", "entry"}) header.set(key, orNull(header.find(key)));
  for (const char* key : {"removed", "hashed"}) {
    if (!header.contains(key)) header.set(key, Array());
  }
  header.set("kind", kKinds[static_cast<std::size_t>(departure.kind)]);
  header.set("to", departure.to);
  header.set("bytes", departure.bytes);
  header.set("events", departure.events);
  header.set("headers", Array(headerLines.begin(), headerLines.end()));
  return _history->begins(std::move(header), {body, std::move(file), departure.bytes});
}

void OwnerGate::ended(std::uint64_t record, const http::DepartureEnd& end) {
  if (!_history || record == 0) return;
  _history->ended(record, {{"status", end.status == 0 ? nullValue() : end.status},
                           {"error", end.error.empty() ? nullValue() : end.error},
                           {"transmissions", end.transmissions}});
}

}  // namespace veltrad::config
