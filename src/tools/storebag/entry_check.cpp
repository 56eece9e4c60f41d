// SPDX-License-Identifier: Apache-2.0
// Finds entries and filters that never take effect, and fields that an entry exposes.
#include "storebag/entry_check.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <iterator>
#include <set>
#include <string>
#include <vector>

#include "base/text.h"
#include "config/client_entry.h"
#include "storebag/clientele.h"
#include "storebag/spelling.h"

namespace veltrad::storebag {
namespace {

using config::ClientEntry;
using config::FilterAction;
using config::filterTag;
using enum FindingName;

constexpr const char* kKeepAction = "keep";
// The largest method and status of an event.
constexpr std::int32_t kMostCode = 65'535;

// An entry's clientele, and its number.
struct Numbered : Clientele {
  Numbered(std::size_t place, const ClientEntry& entry) : Clientele(entry), number(place) {}
  std::size_t number;
};

std::vector<const std::string*> eachOf(const Names& names) {
  std::vector<const std::string*> all;
  for (const std::string& name : names) all.push_back(&name);
  if (all.empty()) all.push_back(nullptr);
  return all;
}

// Such an entry has a separate finding, and the clients that it matches are unknown.
bool hasWrongNames(const Dictionary& entry) {
  return (entry.contains("client") && !entry.string("client")) ||
         (entry.contains("service") && !entry.string("service"));
}

// The earlier entries that together match all clients of `entry`; empty if it matches further clients.
std::set<std::size_t> shadowsOf(const Clientele& entry, const std::vector<Numbered>& above) {
  std::set<std::size_t> shadows;
  for (const std::string* client : eachOf(entry.clients)) {
    for (const std::string* service : eachOf(entry.services)) {
      const auto at = std::find_if(above.begin(), above.end(),
                                   [&](const Numbered& other) { return other.fits(client, service); });
      if (at == above.end()) return {};
      shadows.insert(at->number);
    }
  }
  return shadows;
}

std::string listedNumbers(const std::set<std::size_t>& numbers) {
  std::string text;
  for (const std::size_t number : numbers) text += fmt::format("{}[{}]", text.empty() ? "" : " and ", number);
  return text;
}

// "peerNumber" and "peer_number": "peer", "number".
std::vector<std::string> wordsOf(const std::string& name) {
  std::vector<std::string> words(1);
  for (std::size_t i = 0; i < name.size(); ++i) {
    const auto c = static_cast<unsigned char>(name[i]);
    const bool begins =
        std::isupper(c) != 0 && i > 0 && std::islower(static_cast<unsigned char>(name[i - 1]));
    if ((begins || !std::isalnum(c)) && !words.back().empty()) words.emplace_back();
    if (std::isalnum(c)) words.back() += static_cast<char>(std::tolower(c));
  }
  return words;
}

bool hasFewValues(const std::string& name) {
  static const Names kWords{"number", "phone",  "mac",      "ip",       "ipv4",    "email",  "mail",
                            "imei",   "imsi",   "iccid",    "msisdn",   "serial",  "ssid",   "bssid",
                            "zip",    "pin",    "birth",    "birthday", "age",     "gender", "ssn",
                            "tel",    "mobile", "hostname", "udid",     "postcode"};
  static constexpr std::size_t kFewestInside = 5;
  for (const std::string& word : wordsOf(name)) {
    if (kWords.contains(word)) return true;
    for (const std::string& known : kWords)
      if (known.size() >= kFewestInside && word.find(known) != std::string::npos) return true;
  }
  return false;
}

bool isKnownAction(const std::string& action) {
  const auto& known = config::kFilterActions;
  return action == kKeepAction || std::any_of(std::begin(known), std::end(known),
                                              [&](const auto& row) { return action == row.first; });
}

// A filter that can be compared with others.
struct Filter {
  std::size_t number;
  std::string key;  // in lower case
  filterTag content;

  bool fitsWhenever(const Filter& other) const {
    return key == other.key && (content.method < 0 || content.method == other.content.method) &&
           (content.status < 0 || content.status == other.content.status);
  }
  // Whether it decides on a field of the user info when a batch is flushed.
  bool fitsFlush() const { return content.method <= 0 && content.status <= 0; }
  bool keeps() const { return content.action == FilterAction::keep; }
};

void checkAction(LintSink& sink, const Spot& at, const Dictionary& filter) {
  const std::string* action = filter.string("action");
  const bool isMisnamed = std::any_of(filter.begin(), filter.end(), [](const auto& entry) {
    return !filterTag::kKeys.find(entry.first) && closestName(entry.first, {"action"});
  });
  if (action == nullptr && !filter.contains("action") && !isMisnamed)
    return sink.say(filter_without_action, at, "no \"action\": the field leaves the device in clear");
  if (action == nullptr || isKnownAction(*action)) return;
  std::vector<std::string> known{kKeepAction};
  for (const auto& row : config::kFilterActions) known.emplace_back(row.first);
  const auto meant = closestName(*action, known);
  const std::string question = meant ? fmt::format("; did you mean {}?", quoted(*meant)) : "";
  sink.say(
      unknown_action, at.key("action"),
      fmt::format("unknown action {}: the field leaves the device in clear{}", quoted(*action), question));
}

// Of the filter at `place` among all.
void checkFilter(LintSink& sink, const Spot& at, const std::vector<Filter>& filters, std::size_t place) {
  const Filter& filter = filters[place];
  const auto end = filters.begin() + static_cast<std::ptrdiff_t>(place);
  const auto above =
      std::find_if(filters.begin(), end, [&](const Filter& other) { return other.fitsWhenever(filter); });
  const std::string field = quoted(*filter.content.key);
  if (above != end)
    sink.say(filter_never_applies, at,
             fmt::format("never applies: filter [{}] decides on {} first", above->number, field));
  else if (filter.content.method > kMostCode || filter.content.status > kMostCode)
    sink.say(filter_never_applies, at,
             fmt::format("never applies: no method and no status is above {}", kMostCode),
             "Write the category of the messages as \"method\", their type as \"status\".");
  if (filter.keeps()) return;
  if (filter.content.action == FilterAction::sha256 && hasFewValues(*filter.content.key))
    sink.say(guessable_hash, at,
             fmt::format("the digest of {} can be found by trying all values that there are", field));
  if (filter.fitsFlush()) return;
  const auto flush = std::find_if(filters.begin(), filters.end(), [&](const Filter& other) {
    return other.key == filter.key && other.fitsFlush();
  });
  if (flush == filters.end() || flush->keeps())
    sink.say(
        filter_undone_by_flush, at,
        fmt::format("holds for one method or status alone: if {} is in the user info, the flush of a batch "
                    "adds it again in clear",
                    field),
        fmt::format("Add {{\"key\": {}, \"action\": \"remove\"}} below it.", field));
}

}  // namespace

void checkEntries(LintSink& sink, const Spot& at, const Array& entries) {
  std::vector<Numbered> above;
  for (std::size_t i = 0; i < entries.size(); ++i) {
    const Dictionary* dictionary = entries[i].asDictionary();
    if (dictionary == nullptr || hasWrongNames(*dictionary)) continue;
    const Numbered entry(i, config::parsed<ClientEntry>(*dictionary));
    const auto same =
        std::find_if(above.begin(), above.end(), [&](const Clientele& other) { return entry == other; });
    if (same != above.end()) {
      sink.say(
          duplicate_entry, at.element(i),
          fmt::format("the same clients and services as entry [{}], which is used even where it refuses: "
                      "this one never is",
                      same->number));
    } else if (const auto shadows = shadowsOf(entry, above); !shadows.empty()) {
      sink.say(shadowed_entry, at.element(i),
               fmt::format("never used: everyone whom it fits has {} {} first",
                           shadows.size() == 1 ? "entry" : "entries", listedNumbers(shadows)),
               fmt::format("Put it above {}, or take it out.", listedNumbers({*shadows.begin()})));
    }
    above.push_back(entry);
  }
}

void checkFilters(LintSink& sink, const Spot& at, const Array& filters) {
  std::vector<Filter> read;
  for (std::size_t i = 0; i < filters.size(); ++i) {
    const Dictionary* dictionary = filters[i].asDictionary();
    if (dictionary == nullptr) continue;
    checkAction(sink, at.element(i), *dictionary);
    const auto filter = config::parsed<filterTag>(*dictionary);
    if (filter.key) read.push_back({i, lowerCase(*filter.key), filter});
  }
  for (std::size_t i = 0; i < read.size(); ++i) checkFilter(sink, at.element(read[i].number), read, i);
}

void checkConsent(LintSink& sink, const Spot& at, const Dictionary& entry) {
  if (entry.int32("override_dnu") != 1) return;
  sink.say(overrides_consent, at.key("override_dnu"),
           "\"override_dnu\" is 1: the clients of this entry report for users who have not consented, too");
  const Array* filters = entry.array("filters");
  if (filters != nullptr && filters->empty())
    sink.say(reports_without_consent, at, "reports without consent, and without filters everything in clear",
             "Add filters for what need not leave the device.");
}

}  // namespace veltrad::storebag
