// SPDX-License-Identifier: Apache-2.0
// Pairs entries by their lists, and asks of every name in them which entry it gets before and now.
#include "storebag/clients_diff.h"

#include <fmt/format.h>

#include <algorithm>

#include "backends/https/text_lists.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

using config::ClientEntry;
using Number = std::optional<std::size_t>;

// The name of a client or service that no entry names.
const std::string kAnyOther = "\x7F";
constexpr std::size_t kMostShown = 4;

// As the daemon reads them: what is no dictionary is passed over.
std::vector<WrittenEntry> entriesIn(const Array& clients) {
  std::vector<WrittenEntry> entries;
  for (const Value& item : clients)
    if (const Dictionary* entry = item.asDictionary()) entries.emplace_back(*entry);
  return entries;
}

Number entryFor(const std::vector<WrittenEntry>& entries, const std::string& client,
                const std::string& service) {
  const auto at = std::find_if(entries.begin(), entries.end(), [&](const WrittenEntry& one) {
    return backends::matchClientNameAndServiceID(one.entry, client, service);
  });
  return at == entries.end() ? std::nullopt : Number(at - entries.begin());
}

Number entryWithAddress(const std::vector<WrittenEntry>& entries) {
  const auto at = std::find_if(entries.begin(), entries.end(),
                               [](const WrittenEntry& one) { return one.entry.postURL.has_value(); });
  return at == entries.end() ? std::nullopt : Number(at - entries.begin());
}

// Whether any event of a client that requires user info can leave.
bool letsOut(const ClientEntry& entry) {
  const auto& countries = entry.perCountrySamplingThresholds;
  const bool somewhere =
      countries && std::any_of(countries->begin(), countries->end(), [](const config::CountryThreshold& row) {
        return row.threshold.value_or(0) > 0;
      });
  return entry.filters && !entry.localeWhitelist.texts.empty() && !recipientOf(entry.postURL).empty() &&
         (entry.samplingThreshold.value_or(0) > 0 || somewhere);
}

std::string clientText(const std::string& client, const std::string& service) {
  std::string text = client == kAnyOther ? "every other client" : client;
  if (service != kAnyOther) text += fmt::format(" (service {})", service);
  return text;
}

std::string shownNames(std::vector<std::string> names) {
  if (names.size() <= kMostShown) return listedWithAnd(names);
  const std::size_t more = names.size() - kMostShown;
  names.resize(kMostShown);
  return fmt::format("{} and {} more", listed(names), more);
}

}  // namespace

ClientsDiff::ClientsDiff(const Array& before, const Array& now, ChangePlace at, std::vector<Change>& changes)
    : _old(entriesIn(before)), _now(entriesIn(now)), _at(std::move(at)), _changes(changes) {}

void ClientsDiff::compare() {
  pairUp();
  comparePairs();
  followClients();
  followSessionsWithoutUserInfo();
  sayAdded();
  sayRemoved();
  sayOrder();
}

void ClientsDiff::pairUp() {
  std::vector<Clientele> now;
  for (const WrittenEntry& entry : _now) now.emplace_back(entry.entry);
  _partnerOfOld.resize(_old.size());
  _partnerOfNow.resize(_now.size());
  for (std::size_t i = 0; i < _old.size(); ++i) {
    const Clientele before(_old[i].entry);
    for (std::size_t j = 0; j < _now.size() && !_partnerOfOld[i]; ++j) {
      if (_partnerOfNow[j] || before != now[j]) continue;
      _partnerOfOld[i] = j;
      _partnerOfNow[j] = i;
    }
  }
}

ChangeSink ClientsDiff::sinkAt(const WrittenEntry& entry, std::size_t number) const {
  ChangePlace at = _at;
  at.entry = number;
  const auto list = [&](const char* key) {
    const std::string* text = entry.asGiven.string(key);
    return text ? std::optional(*text) : std::nullopt;
  };
  at.client = list("client");
  at.service = list("service");
  return ChangeSink(_changes, std::move(at));
}

void ClientsDiff::comparePairs() {
  for (std::size_t i = 0; i < _now.size(); ++i) {
    if (!_partnerOfNow[i]) continue;
    ChangeSink sink = sinkAt(_now[i], i);
    EntryDiff(_old[*_partnerOfNow[i]], _now[i], whoIn(_now[i].entry, i), sink).compare();
  }
}

Effect ClientsDiff::effectOf(const Move& move) const {
  const auto& [before, now] = move;
  if (!before) return now && letsOut(_now[*now].entry) ? Effect::more : Effect::other;
  if (!now) return letsOut(_old[*before].entry) ? Effect::less : Effect::other;
  std::vector<Change> changes;
  ChangeSink sink(changes, _at);
  EntryDiff(_old[*before], _now[*now], "", sink).compare();
  return worstOf(changes);
}

// Takes down who gets another entry than before.
void ClientsDiff::follow(const std::string& who, const Move& move, Effect effect) {
  const auto& [before, now] = move;
  const auto note = [&](Moved& moved, const Number& other) {
    moved.effect = std::min(moved.effect, effect);
    moved.who.push_back(who);
    moved.others.insert(other);
  };
  const bool isNew = now && !_partnerOfNow[*now], isGone = before && !_partnerOfOld[*before];
  if (isNew) note(_added[*now], before);
  if (isGone) note(_removed[*before], now);
  if (!isNew && !isGone && before && now && _partnerOfOld[*before] != now) note(_moved[move], before);
}

void ClientsDiff::followClients() {
  Names clients{kAnyOther}, services{kAnyOther};
  for (const auto* entries : {&_old, &_now}) {
    for (const WrittenEntry& one : *entries) {
      clients.merge(lowered(one.entry.client));
      services.merge(lowered(one.entry.service));
    }
  }
  std::map<Move, Effect> effects;
  for (const std::string& client : clients) {
    std::map<Move, std::vector<std::string>> moves;
    for (const std::string& service : services)
      moves[{entryFor(_old, client, service), entryFor(_now, client, service)}].push_back(service);
    for (const auto& [move, moving] : moves) {
      auto known = effects.find(move);
      if (known == effects.end()) known = effects.emplace(move, effectOf(move)).first;
      if (moves.size() == 1) {
        follow(clientText(client, kAnyOther), move, known->second);
        continue;
      }
      for (const std::string& service : moving) follow(clientText(client, service), move, known->second);
    }
  }
}

// Of these the first entry with an address says where their events go, and nothing else.
void ClientsDiff::followSessionsWithoutUserInfo() {
  const Move move(entryWithAddress(_old), entryWithAddress(_now));
  const auto addressOf = [](const std::vector<WrittenEntry>& entries, const Number& number) {
    return number ? entries[*number].entry.postURL : std::nullopt;
  };
  const auto before = addressOf(_old, move.first), now = addressOf(_now, move.second);
  if (before != now) follow("sessions that require no user info", move, effectOfAddress(before, now));
}

std::string ClientsDiff::othersIn(const Moved& moved, const std::vector<WrittenEntry>& entries) {
  std::vector<std::string> others;
  for (const auto& other : moved.others)
    if (other) others.push_back(whoIn(entries[*other].entry, *other));
  return shownNames(std::move(others));
}

void ClientsDiff::sayAdded() {
  for (std::size_t i = 0; i < _now.size(); ++i) {
    if (_partnerOfNow[i]) continue;
    const Moved& moved = _added[i];
    const WrittenEntry& entry = _now[i];
    std::string text = whoIn(entry.entry, i) + ": new entry";
    if (moved.who.empty()) text += ", which nobody gets";
    if (moved.others.contains(std::nullopt) && letsOut(entry.entry))
      text += ": events go to " + recipientOf(entry.entry.postURL);
    if (const std::string others = othersIn(moved, _old); !others.empty())
      text += fmt::format("; it comes before that of {}", others);
    sinkAt(entry, i).say(ChangeKind::entry, moved.effect, std::nullopt, std::nullopt, Value(entry.asGiven),
                         std::move(text));
  }
}

void ClientsDiff::sayRemoved() {
  for (std::size_t i = 0; i < _old.size(); ++i) {
    if (_partnerOfOld[i]) continue;
    const Moved& moved = _removed[i];
    const WrittenEntry& entry = _old[i];
    std::string text = whoIn(entry.entry, i) + ": the entry is gone";
    if (moved.who.empty()) text += ", which nobody got";
    if (moved.others.contains(std::nullopt) && letsOut(entry.entry))
      text += fmt::format(": no more events go to {}", recipientOf(entry.entry.postURL));
    if (const std::string others = othersIn(moved, _now); !others.empty())
      text += fmt::format("; its place is taken by that of {}", others);
    sinkAt(entry, i).say(ChangeKind::entry, moved.effect, std::nullopt, Value(entry.asGiven), std::nullopt,
                         std::move(text));
  }
}

void ClientsDiff::sayOrder() {
  const auto number = [](std::size_t place) { return Value(static_cast<std::uint64_t>(place)); };
  for (const auto& [move, moved] : _moved) {
    const auto& [before, now] = move;
    sinkAt(_now[*now], *now)
        .say(ChangeKind::order, moved.effect, std::nullopt, number(*before), number(*now),
             fmt::format("{}: now the entry of {} comes first, before it was that of {}",
                         shownNames(moved.who), whoIn(_now[*now].entry, *now),
                         whoIn(_old[*before].entry, *before)));
  }
  std::vector<std::size_t> order;
  for (const auto& partner : _partnerOfOld)
    if (partner) order.push_back(*partner);
  if (!_moved.empty() || std::is_sorted(order.begin(), order.end())) return;
  ChangeSink(_changes, _at)
      .say(ChangeKind::order, Effect::other, std::nullopt, std::nullopt, std::nullopt,
           "the entries stand in another order, and every client keeps its own");
}

}  // namespace veltrad::storebag
