// SPDX-License-Identifier: Apache-2.0
// Checks the owner's decision, the section and its client entry, in this order.
#include "backends/https/spool_verdicts.h"

#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "backends/https/text_lists.h"
#include "config/owner_gate.h"
#include "http/host_name.h"
#include "support/spool_entry.h"

namespace veltrad::backends {

using wire::Reason;

bool isToBeKept(const http::HTTPResult& result) {
  using Kind = http::HTTPError::Kind;
  if (!result) {
    const Kind kind = result.error().kind;
    return kind == Kind::transport || kind == Kind::tooMany || kind == Kind::stopping;
  }
  const int status = result.value().status;
  return status == 408 || status == 425 || status == 429 ||
         (status >= 500 && status <= 599 && status != 501 && status != 505);
}

std::string outcomeOf(const http::HTTPResult& result) {
  return result ? fmt::format("HTTP {}", result.value().status) : result.error().description;
}

bool tellsOfServer(const http::HTTPResult& result) {
  return result || result.error().kind == http::HTTPError::Kind::transport ||
         result.error().kind == http::HTTPError::Kind::tooLarge;
}

int triesOf(const http::HTTPResult& result) {
  if (result) return std::max(1, result.value().transmissions);
  const http::HTTPError& error = result.error();
  return error.begun && error.refusal != Reason::over_daily_limit ? std::max(1, error.transmissions) : 0;
}

std::optional<Reason> refusalByOwner(const support::SpoolEntry& post, const config::OwnerDecision& decision) {
  return decision.refusalFor(post.text("backend"), {http::hostName(post.url)});
}

namespace {
std::optional<Reason> refusalByEntry(const support::SpoolEntry& post, const config::StorebagSection* section,
                                     const ClientFacts& facts) {
  // Without the names that choose the entry, too, consent alone can be asked.
  if (!section || post.namesHidden) return facts.consent ? std::nullopt : std::optional(Reason::no_consent);
  const auto found = section->backends.find(post.text("backend"));
  if (found == section->backends.end() || !found->second) return Reason::no_entry;
  const auto* profile = std::get_if<config::HTTPSPostProfile>(found->second.get());
  if (!profile || !profile->clients) return Reason::no_entry;
  const auto name = [&post](const char* key) {
    const std::string* text = post.client.string(key);
    return text ? std::optional(*text) : std::nullopt;
  };
  const auto& clients = *profile->clients;
  const auto entry = std::find_if(clients.begin(), clients.end(), [&](const config::ClientEntry& candidate) {
    return matchClientNameAndServiceID(candidate, name("client"), name("service"));
  });
  return entry == clients.end() ? Reason::no_entry : refusalBeforeSampling(*entry, facts);
}
}  // namespace

LeaveVerdict verdictOnLeaving(const support::SpoolEntry& post, const config::OwnerDecision& decision,
                              const config::StorebagSection* section,
                              const std::optional<ClientFacts>& facts) {
  if (const auto refused = refusalByOwner(post, decision)) return {refused, false};
  if (!post.asksEntry) return {};
  if (!facts) return {std::nullopt, true};
  return {refusalByEntry(post, section, *facts), false};
}

Reason countedFromSpool(Reason why) {
  static constexpr std::pair<Reason, Reason> kReasons[] = {
      {Reason::by_hand, Reason::by_hand},
      {Reason::spool_full, Reason::spool_full},
      {Reason::spool_share, Reason::spool_share},
      {Reason::spool_expired, Reason::spool_expired},
      {Reason::spool_disk, Reason::spool_disk},
      {Reason::no_entry, Reason::spool_no_entry},
      {Reason::no_consent, Reason::spool_no_consent},
      {Reason::country_not_listed, Reason::spool_country_not_listed},
      {Reason::device_not_listed, Reason::spool_device_not_listed},
      {Reason::device_refused, Reason::spool_device_refused},
      {Reason::no_filters, Reason::spool_no_filters},
      {Reason::policy_broken, Reason::spool_policy_broken},
      {Reason::policy_reporting, Reason::spool_policy_reporting},
      {Reason::policy_consent, Reason::spool_policy_consent},
      {Reason::policy_backends, Reason::spool_policy_backends},
      {Reason::policy_hosts, Reason::spool_policy_hosts},
      {Reason::privacy_off, Reason::spool_privacy_off},
      {Reason::over_daily_limit, Reason::spool_over_daily_limit}};
  const auto* const found = std::find_if(std::begin(kReasons), std::end(kReasons),
                                         [why](const auto& pair) { return pair.first == why; });
  return found == std::end(kReasons) ? Reason::spool_refused_by_owner : found->second;
}

}  // namespace veltrad::backends
