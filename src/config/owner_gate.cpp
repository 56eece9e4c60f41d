// SPDX-License-Identifier: Apache-2.0
// Puts the owner's word together. Any thread.
#include "config/owner_gate.h"

#include <algorithm>
#include <string>
#include <utility>

#include "config/preference_keys.h"
#include "platform/device_secret.h"
#include "platform/preferences.h"

namespace veltrad::config {

namespace {
// Nothing: it cannot be read just now.
std::optional<bool> isTrue(platform::Preferences& preferences, const char* key) {
  const auto found = preferences.lookUp(platform::kVeltraPreferenceDomain, key);
  if (!found) return std::nullopt;
  return found.value() && found.value()->toBoolean().value_or(false);
}

std::string textOf(wire::Reason reason) {
  return std::string("The owner of the device does not let it leave (") +
         std::string(wire::entryOf(reason).name) + ")";
}
}  // namespace

std::optional<wire::Reason> OwnersWord::refusalFor(std::string_view backend,
                                                   const std::vector<std::string>& hosts) const {
  if (refusal) return refusal;
  if (!policy->makes(backend)) return wire::Reason::policy_backends;
  const bool reaches = hosts.empty() || std::any_of(hosts.begin(), hosts.end(), [this](const auto& host) {
                         return policy->reaches(host);
                       });
  return reaches ? std::nullopt : std::optional(wire::Reason::policy_hosts);
}

OwnerGate::OwnerGate(OwnerPolicy& policy, platform::Preferences& preferences, platform::DeviceSecret& secret,
                     DailyAllowance& allowance)
    : _policy(policy), _preferences(preferences), _secret(secret), _allowance(allowance) {}

bool OwnerGate::refresh() {
  auto policy = _policy.current();
  const PolicyRules& rules = policy->rules();
  const auto off = isTrue(_preferences, preference::kReportingOff);
  const auto consent =
      rules.consent == ConsentRule::always ? isTrue(_preferences, preference::kConsent) : true;
  if (!off || !consent) return false;
  const auto refusal = *off ? wire::Reason::privacy_off : policy->refusal(*consent);
  const auto before = word();
  auto fields = before->fields;
  if (policy != before->policy) {
    const bool has = !rules.remove.texts.empty() || !rules.hash.texts.empty();
    const auto secret = has ? _secret.bytes() : std::string();
    if (!secret) return false;
    fields = has ? std::make_shared<const FieldRules>(rules, *secret) : nullptr;
  } else if (refusal == before->refusal) {
    return false;
  }
  auto word = std::make_shared<const OwnersWord>(OwnersWord{std::move(policy), refusal, std::move(fields)});
  const Lock held(_mutex);
  _word = std::move(word);
  _turn.fetch_add(1, std::memory_order_release);
  return true;
}

std::shared_ptr<const OwnersWord> OwnerGate::word() const {
  const Lock held(_mutex);
  return _word;
}

std::optional<http::RequestRefusal> OwnerGate::refusal(bool forStorebag, std::string_view host) const {
  const auto now = word();
  auto reason = forStorebag ? std::nullopt : now->refusal;
  if (!reason && !now->policy->reaches(host)) reason = wire::Reason::policy_hosts;
  if (!reason) return std::nullopt;
  return http::RequestRefusal{*reason, textOf(*reason)};
}

std::optional<http::RequestRefusal> OwnerGate::count(std::uint64_t events, std::uint64_t bytes) {
  if (mayLeave(events, bytes)) return std::nullopt;
  return http::RequestRefusal{wire::Reason::over_daily_limit, textOf(wire::Reason::over_daily_limit)};
}

bool OwnerGate::mayLeave(std::uint64_t events, std::uint64_t bytes) {
  return _allowance.take(word()->policy->rules(), events, bytes);
}

}  // namespace veltrad::config
