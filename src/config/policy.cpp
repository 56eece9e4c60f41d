// SPDX-License-Identifier: Apache-2.0
// The keys of policy.json and the verdicts on what may leave. Any thread.
#include "config/policy.h"

#include <algorithm>

#include "base/text.h"
#include "config/choice_row.h"
#include "config/settings_check.h"
#include "platform/local_settings.h"

namespace veltrad::config {
namespace {

using enum KeyType;
using enum Need;

// The largest count that a double represents exactly.
constexpr double kMostCount = 9'007'199'254'740'992;
constexpr Range kCount{0, kMostCount};
constexpr Range kHistoryBytes{65'536, kMostCount};

constexpr auto kHistoryKeys = keysOf<HistoryBounds>({
    row<&HistoryBounds::days>(
        {"days", integer, {1, 36'500}, optional, "7", "Days for which what left is kept."}),
    row<&HistoryBounds::bytes>({"bytes", integer, kHistoryBytes, optional, "67108864",
                                "Bytes that what left may take on disk; the oldest goes first."}),
});

constexpr auto kPolicyKeys = keysOf<PolicyRules>({
    choiceRow<&PolicyRules::reporting>("reporting", "on|off", "on",
                                       "\"off\": no back end reports, and what waits is dropped."),
    choiceRow<&PolicyRules::consent>(
        "consent", "storebag|always", "storebag",
        "\"always\": without the user's consent no back end of any kind reports, whatever the "
        "storebag or the client says; \"storebag\": the storebag decides."),
    row<&PolicyRules::backends>({"backends", texts, kUnbounded, optional, "all",
                                 "Names of the back ends that are made; others are not."}),
    row<&PolicyRules::hosts>(
        {"hosts", texts, kUnbounded, optional, "all",
         "Host names and addresses that may be contacted; \"*.example.com\" means the names below it. The "
         "storebag server must be among them."}),
    row<&PolicyRules::remove>({"remove", texts, kUnbounded, optional, "none",
                               "Names of fields that are taken out of every message before anything sees it; "
                               "letter case is ignored."}),
    row<&PolicyRules::hash>({"hash", texts, kUnbounded, optional, "none",
                             "Names of fields whose values are replaced by a digest with a secret of this "
                             "device; letter case is ignored."}),
    row<&PolicyRules::dailyEvents>(
        {"dailyEvents", integer, kCount, optional, "no limit",
         "Events, datagrams, files and log data that leave in a day (UTC), all destinations together."}),
    row<&PolicyRules::dailyBytes>({"dailyBytes", integer, kCount, optional, "no limit",
                                   "Bytes that leave in a day (UTC), all destinations together."}),
    row<&PolicyRules::history>({"history", dictionary, kUnbounded, optional, "nothing is kept",
                                "What left is kept, exactly as it left, for the owner to read.",
                                &HistoryBounds::kKeys}),
});

// Without the brackets of an IPv6 address and the dot at the end of a complete name.
std::string comparable(std::string_view host) {
  if (host.size() > 2 && host.front() == '[' && host.back() == ']') host = host.substr(1, host.size() - 2);
  if (host.size() > 1 && host.back() == '.') host.remove_suffix(1);
  return lowerCase(std::string(host));
}

}  // namespace

constinit const KeyTable HistoryBounds::kKeys{kHistoryKeys};
constinit const KeyTable PolicyRules::kKeys{kPolicyKeys};

void take(const Key&, const Value& value, Reporting& field) {
  const std::string* text = value.asString();
  field = text && *text == "on" ? Reporting::on : Reporting::off;
}

void take(const Key&, const Value& value, ConsentRule& field) {
  const std::string* text = value.asString();
  field = text && *text == "storebag" ? ConsentRule::storebag : ConsentRule::always;
}

void take(const Key&, const Value& value, std::optional<HistoryBounds>& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = parsed<HistoryBounds>(*dictionary);
}

std::shared_ptr<const Policy> Policy::closed() {
  auto policy = std::make_shared<Policy>();
  policy->_broken = true;
  return policy;
}

std::shared_ptr<const Policy> Policy::of(const platform::LocalContent& content, std::string& error) {
  SettingsFindings found = checkSettings(content, PolicyRules::kKeys);
  if (!found.error && !found.warnings.empty()) found.error = std::move(found.warnings.front());
  if (found.error) {
    error = std::move(*found.error);
    return nullptr;
  }
  const Dictionary& given = *content.value.asDictionary();
  auto policy = std::make_shared<Policy>(parsed<PolicyRules>(given));
  policy->_asGiven = given;
  return policy;
}

std::optional<wire::Reason> Policy::refusal(bool consent) const {
  if (_broken) return wire::Reason::policy_broken;
  if (_rules.reporting == Reporting::off) return wire::Reason::policy_reporting;
  if (_rules.consent == ConsentRule::always && !consent) return wire::Reason::policy_consent;
  return std::nullopt;
}

bool Policy::makes(std::string_view backend) const {
  const auto& names = _rules.backends.texts;
  return !_rules.backends.asGiven || std::find(names.begin(), names.end(), backend) != names.end();
}

bool Policy::reaches(std::string_view host) const {
  if (_broken) return false;
  if (!_rules.hosts.asGiven) return true;
  const std::string name = comparable(host);
  return std::any_of(_rules.hosts.texts.begin(), _rules.hosts.texts.end(), [&name](const std::string& text) {
    const std::string listed = comparable(text);
    if (!listed.starts_with("*.")) return name == listed;
    const std::string_view below = std::string_view(listed).substr(1);
    return name.size() > below.size() && name.ends_with(below);
  });
}

}  // namespace veltrad::config
