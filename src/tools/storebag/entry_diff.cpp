// SPDX-License-Identifier: Apache-2.0
// Says of each key of a client entry what its change means.
#include "storebag/entry_diff.h"

#include <fmt/format.h>

#include <algorithm>
#include <map>
#include <set>
#include <utility>
#include <vector>

#include "backends/https/client_decision.h"
#include "base/text.h"
#include "http/host_name.h"
#include "storebag/clientele.h"
#include "storebag/filter_diff.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

using config::ClientEntry;
using enum ChangeKind;

Effect effectOf(bool more, bool less) {
  return more ? Effect::more : less ? Effect::less : Effect::other;
}

constexpr const char* kFreedText = "; for devices that were held by sampling, the parent session decides now";

// How a list of texts of which one must occur has changed.
struct ListChange {
  std::vector<std::string> added;
  std::vector<std::string> gone;
  // The new list accepts, or no longer accepts, something.
  bool wider = false;
  bool narrower = false;
};

bool isCovered(const std::string& text, const Names& by) {
  return std::any_of(by.begin(), by.end(),
                     [&](const std::string& other) { return text.find(other) != std::string::npos; });
}

ListChange changeOf(const config::TextList& before, const config::TextList& now) {
  const Names old = lowered(before.texts), current = lowered(now.texts);
  ListChange change;
  for (const std::string& text : now.texts) {
    if (old.contains(lowerCase(text))) continue;
    change.added.push_back(text);
    change.wider = change.wider || !isCovered(lowerCase(text), old);
  }
  for (const std::string& text : before.texts) {
    if (current.contains(lowerCase(text))) continue;
    change.gone.push_back(text);
    change.narrower = change.narrower || !isCovered(lowerCase(text), current);
  }
  return change;
}

double shareOf(const std::optional<double>& threshold) {
  return std::clamp(threshold.value_or(0), 0.0, 1.0);
}

// The share of devices that report a message that overrides sampling. Without a threshold none does.
double overriddenShare(const ClientEntry& entry, const std::optional<double>& threshold) {
  return threshold ? std::max(shareOf(threshold), shareOf(entry.overrideSampling.value_or(1))) : 0;
}

// The threshold of the devices in this country; false: the country is not listed. Consent, devices and
// filters aside.
bool findThreshold(const ClientEntry& entry, const std::string& country, std::optional<double>& threshold) {
  ClientEntry open = entry;
  open.deviceWhitelist = {};
  open.deviceBlacklist = {};
  open.filters.emplace();
  const auto verdict = backends::decideOnClient(open, {true, country, "", std::nullopt, 0});
  threshold = verdict.threshold;
  return verdict.samplingReached;
}

// The countries with thresholds of their own. The country of a locale has capital letters.
std::set<std::string> countriesWithThreshold(const ClientEntry& entry) {
  std::set<std::string> countries;
  if (!entry.perCountrySamplingThresholds) return countries;
  for (const config::CountryThreshold& row : *entry.perCountrySamplingThresholds)
    for (const std::string& country : row.country.texts)
      if (std::none_of(country.begin(), country.end(), [](char c) { return c >= 'a' && c <= 'z'; }))
        countries.insert(country);
  return countries;
}

std::string shareText(double share) {
  return share >= 1 ? "all" : share <= 0 ? "none" : fmt::format("{:.6g} %", share * 100);
}

// "reported by 10 % of devices, now by all"
std::string sharesText(double before, double now) {
  const std::string devices = before >= 1   ? "all devices"
                              : before <= 0 ? "no device"
                                            : shareText(before) + " of devices";
  return fmt::format("reported by {}, now by {}", devices, shareText(now));
}

// "a message that overrides sampling is reported by none of the devices, now by all"
std::string overriddenText(double before, double now) {
  return fmt::format("a message that overrides sampling is reported by {} of the devices, now by {}",
                     shareText(before), shareText(now));
}

std::string placesText(const std::vector<std::string>& countries) {
  return countries.empty() ? "" : ", in " + listedWithAnd(countries);
}

// 0: as the session says.
int batchingOf(const ClientEntry& entry) {
  return !entry.expedite ? 0 : *entry.expedite == 0 ? 1 : 2;
}

// Says of each key of a client entry what its change means.
class EntryDiff {
 public:
  EntryDiff(const WrittenEntry& before, const WrittenEntry& now, const std::string& who, ChangeSink& changes)
      : _before(before), _after(now), _who(who), _changes(changes) {}

  void compare() {
    compareConsent();
    compareCountries();
    compareDevices();
    compareFilters();
    compareSampling();
    compareIdentifiers();
    compareAddresses();
    compareBatching();
  }

 private:
  // Before and now.
  using Thresholds = std::pair<std::optional<double>, std::optional<double>>;
  // The shares of devices that report, 0 to 1, and what their change means.
  struct SharesText {
    Effect effect;
    double before;
    double now;
    std::string text;
  };

  void say(ChangeKind kind, Effect effect, const char* key, std::string text) {
    _changes.sayKey(kind, effect, key, &_before.asGiven, &_after.asGiven, std::move(text));
  }

  void compareConsent() {
    const bool before = _old.overrideDNU == 1, now = _now.overrideDNU == 1;
    if (before == now) return;
    say(consent, effectOf(now, before), "override_dnu",
        _who + (now ? ": now reported without the user's consent, too"
                    : ": no longer reported without the user's consent"));
  }

  void compareCountries() {
    const ListChange change = changeOf(_old.localeWhitelist, _now.localeWhitelist);
    if (!change.wider && !change.narrower) return;
    std::vector<std::string> parts;
    if (!change.added.empty()) parts.push_back("also in " + listedWithAnd(change.added));
    if (!change.gone.empty()) parts.push_back("no longer in " + listedWithAnd(change.gone));
    const auto& before = _old.localeWhitelist.texts;
    say(country, effectOf(change.wider, change.narrower), "locale_whitelist",
        fmt::format("{}: reported in {}, now {}", _who, before.empty() ? "no country" : listedWithAnd(before),
                    listed(parts)));
  }

  void compareDevices() {
    const ListChange accepted = changeOf(_old.deviceWhitelist, _now.deviceWhitelist);
    if (accepted.wider || accepted.narrower) {
      const auto& before = _old.deviceWhitelist.texts;
      const auto& now = _now.deviceWhitelist.texts;
      const bool more = !before.empty() && (now.empty() || accepted.wider);
      const bool less = !now.empty() && (before.empty() || accepted.narrower);
      const auto shown = [](const std::vector<std::string>& families) {
        return families.empty() ? "every product family" : "product family " + listed(families, " or ");
      };
      say(device, effectOf(more, less), "device_whitelist",
          fmt::format("{}: reported by devices of {}, now by those of {}", _who, shown(before), shown(now)));
    }
    const ListChange refused = changeOf(_old.deviceBlacklist, _now.deviceBlacklist);
    if (!refused.wider && !refused.narrower) return;
    std::vector<std::string> parts;
    if (!refused.gone.empty())
      parts.push_back("no longer refused on hardware " + listedWithAnd(refused.gone));
    if (!refused.added.empty()) parts.push_back("now refused on hardware " + listedWithAnd(refused.added));
    say(device, effectOf(refused.narrower, refused.wider), "device_blacklist",
        fmt::format("{}: {}", _who, listed(parts)));
  }

  void compareFilters() {
    if (_old.filters.has_value() != _now.filters.has_value())
      return say(filter, effectOf(_now.filters.has_value(), _old.filters.has_value()), "filters",
                 _who + (_now.filters ? ": nothing was reported without \"filters\", which are there now"
                                      : ": nothing is reported any more, because \"filters\" are missing"));
    if (!_old.filters) return;
    for (const FieldChange& field : changedFields(*_old.filters, *_now.filters))
      _changes.say(filter, field.effect, field.name, field.before, field.now,
                   fmt::format("field {} {} for {}{}", field.name, field.phrase, _who, field.events));
  }

  void compareSampling() {
    const std::set<std::string> old = countriesWithThreshold(_old), now = countriesWithThreshold(_now);
    const std::optional<SharesText> changed = changedShares(_old.samplingThreshold, _now.samplingThreshold);
    if (changed) {
      std::vector<std::string> countries;
      for (const std::string& listedCountry : _now.localeWhitelist.texts)
        if (!old.contains(listedCountry) || !now.contains(listedCountry)) countries.push_back(listedCountry);
      // A locale without a country passes every list.
      const bool nowhereElse = countries.empty() && !_now.localeWhitelist.texts.empty();
      say(sampling, changed->effect, "sampling_threshold",
          fmt::format("{}: {}{}", _who, changed->text,
                      nowhereElse ? ", where the locale has no country" : placesText(countries)));
    }
    compareCountryThresholds();
    compareHeld();
  }

  // Whether more or fewer devices report with another threshold, if only messages that override sampling.
  std::optional<SharesText> changedShares(const std::optional<double>& old,
                                          const std::optional<double>& now) const {
    const double before = shareOf(old), after = shareOf(now);
    const bool freed = freesHeld({old, now});
    const char* more = freed ? kFreedText : "";
    if (before != after)
      return SharesText{effectOf(after > before || freed, after < before), before, after,
                        sharesText(before, after) + more};
    if (old.has_value() == now.has_value()) return std::nullopt;
    const double overridden = overriddenShare(_old, old), overriddenNow = overriddenShare(_now, now);
    if (overridden == overriddenNow) return std::nullopt;
    return SharesText{effectOf(overriddenNow > overridden || freed, overriddenNow < overridden), before,
                      after, overriddenText(overridden, overriddenNow) + more};
  }

  // With a hierarchy the parent session decides for every device, sampled out or not, but for those that are
  // held by sampling.
  bool freesHeld(const Thresholds& thresholds) const {
    const double held = overriddenShare(_old, thresholds.first);
    return _now.hierarchy != 0 && shareOf(thresholds.first) < held &&
           overriddenShare(_now, thresholds.second) < held;
  }

  // The old and new thresholds of countries that are listed before and now and have a threshold of their own
  // before or now.
  std::map<std::string, Thresholds> countryThresholds() const {
    std::set<std::string> countries = countriesWithThreshold(_old);
    countries.merge(countriesWithThreshold(_now));
    std::map<std::string, Thresholds> all;
    for (const std::string& one : countries) {
      Thresholds both;
      if (findThreshold(_old, one, both.first) && findThreshold(_now, one, both.second))
        all.emplace(one, both);
    }
    return all;
  }

  // Compares the thresholds of single countries, unless they follow from the others.
  void compareCountryThresholds() {
    for (const auto& [one, thresholds] : countryThresholds()) {
      const auto changed = changedShares(thresholds.first, thresholds.second);
      if (changed)
        _changes.say(sampling, changed->effect, "per_country_sampling_thresholds", Value(changed->before),
                     Value(changed->now), fmt::format("{}: {}, in {}", _who, changed->text, one));
    }
  }

  // Events of devices that are sampled out leave if one of them overrides sampling.
  void compareHeld() {
    const double before = shareOf(_old.overrideSampling.value_or(1));
    const double now = shareOf(_now.overrideSampling.value_or(1));
    if (before == now) return;
    bool more = false, less = false, freed = false;
    const auto compareWhere = [&](const Thresholds& thresholds) {
      const double old = overriddenShare(_old, thresholds.first);
      const double current = overriddenShare(_now, thresholds.second);
      freed = freed || freesHeld(thresholds);
      more = more || freed || (now > before && current > old);
      less = less || (now < before && current < old);
    };
    compareWhere({_old.samplingThreshold, _now.samplingThreshold});
    for (const auto& [one, thresholds] : countryThresholds()) compareWhere(thresholds);
    say(sampling, effectOf(more, less), "override_sampling",
        fmt::format("{}: {}{}", _who, overriddenText(before, now), freed ? kFreedText : ""));
  }

  void compareIdentifiers() {
    const bool oldExtras = _old.extrasOnInternal != 0, extras = _now.extrasOnInternal != 0;
    if (oldExtras != extras)
      say(identifier, effectOf(extras, oldExtras), "extras_on_internal",
          _who + (extras ? ": internal builds now bear the device's own identifier"
                         : ": internal builds no longer bear the device's own identifier"));
    if (_old.customClientID != _now.customClientID)
      say(identifier, effectOf(_old.customClientID, _now.customClientID), "custom_clientId",
          _who + (_now.customClientID
                      ? ": events now bear an identifier of the client alone, not that of the installation"
                      : ": events now bear the identifier that all clients of the installation share"));
    if (_old.hierarchy != _now.hierarchy)
      say(hierarchy, Effect::more, "hierarchy",
          fmt::format("{}: level {} of its family, now {}: {}", _who, _old.hierarchy, _now.hierarchy,
                      _now.hierarchy != 0 ? "its parent session decides whether it reports"
                                          : "no parent session decides any more whether it reports"));
  }

  void compareAddresses() {
    const auto compareOne = [this](const char* key, const char* events, const auto& before, const auto& now) {
      const std::string old = recipientOf(before), current = recipientOf(now);
      std::string text = fmt::format("{} of {} ", events, _who);
      if (current.empty())
        text += "can no longer be posted";
      else if (old.empty())
        text += fmt::format("go to {}; before, they could not be posted", current);
      else if (old != current)
        text += fmt::format("go to another host: {}, no longer {}", current, old);
      else
        text += fmt::format("go to {}, no longer to {}", *now, *before);
      say(address, effectOfAddress(before, now), key, std::move(text));
    };
    if (_old.postURL != _now.postURL) compareOne("post_url", "events", _old.postURL, _now.postURL);
    if (_old.realtimePostURL == _now.realtimePostURL) return;
    const auto& before = _old.realtimePostURL ? _old.realtimePostURL : _old.postURL;
    const auto& now = _now.realtimePostURL ? _now.realtimePostURL : _now.postURL;
    if (before != now) compareOne("realtime_post_url", "realtime events", before, now);
  }

  void compareBatching() {
    static constexpr const char* kTexts[] = {"as the session says", "in batches", "each at once"};
    const int before = batchingOf(_old), now = batchingOf(_now);
    if (before != now)
      say(batching, Effect::other, "expedite",
          fmt::format("{}: events leave {}, before {}", _who, kTexts[now], kTexts[before]));
    if (_old.eventThreshold != _now.eventThreshold)
      say(batching, Effect::other, "event_threshold",
          fmt::format("{}: a batch leaves above {} events of a method, now above {}", _who,
                      _old.eventThreshold, _now.eventThreshold));
  }

  const WrittenEntry& _before;
  const WrittenEntry& _after;
  const ClientEntry& _old = _before.entry;
  const ClientEntry& _now = _after.entry;
  const std::string& _who;
  ChangeSink& _changes;
};

}  // namespace

std::string whoIn(const ClientEntry& entry, std::size_t number) {
  std::string who = !entry.client.empty() ? listedWithAnd(entry.client)
                    : number == 0         ? "every client"
                                          : "every other client";
  if (!entry.service.empty()) who += fmt::format(" (service {})", listed(entry.service, " or "));
  return who;
}

std::string recipientOf(const std::optional<std::string>& address) {
  constexpr std::string_view kScheme = "https://";
  return address && lowerCase(*address).starts_with(kScheme) ? lowerCase(http::hostName(*address)) : "";
}

Effect effectOfAddress(const std::optional<std::string>& before, const std::optional<std::string>& now) {
  const std::string old = recipientOf(before), current = recipientOf(now);
  return effectOf(!current.empty() && current != old, current.empty() && !old.empty());
}

void compareEntries(const WrittenEntry& before, const WrittenEntry& now, const std::string& who,
                    ChangeSink& changes) {
  EntryDiff(before, now, who, changes).compare();
}

}  // namespace veltrad::storebag
