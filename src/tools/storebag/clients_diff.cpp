// SPDX-License-Identifier: Apache-2.0
// Pairs entries by their lists, and compares for every name in them the old and the new matching entry.
#include "storebag/clients_diff.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>

#include "backends/https/text_lists.h"
#include "storebag/clientele.h"
#include "storebag/entry_diff.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

using config::ClientEntry;
using Number = std::optional<std::size_t>;

// The name of a client or service that no entry names.
const std::string kAnyOther = "\x7F";
constexpr std::size_t kMostShown = 4;
// Only texts that have changed places make such pairs.
constexpr std::size_t kMostPairs = 1000;

// As the daemon reads them: elements that are no dictionaries are skipped.
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

// The first of both; nothing comes last.
Number firstOf(const Number& a, const Number& b) {
  return a && b ? std::min(a, b) : a ? a : b;
}

// The addresses for sessions that require no user info.
struct Addresses {
  // The entry that was taken.
  Number number;
  std::optional<std::string> post, realtime;
  bool extras = false;
};

// The first entry with "post_url" is taken; if none has it, the last one still gives "realtime_post_url".
Addresses addressesIn(const std::vector<WrittenEntry>& entries) {
  Addresses taken;
  for (std::size_t i = 0; i < entries.size() && !taken.post; ++i) {
    const ClientEntry& entry = entries[i].entry;
    taken = {i, entry.postURL, entry.realtimePostURL ? entry.realtimePostURL : entry.postURL,
             entry.postURL && entry.extrasOnInternal != 0};
  }
  return taken;
}

// Whether any event of a client that requires user info can leave. A back end that is held by sampling
// reports after a message that overrides it, and with a hierarchy a parent session decides.
bool letsOut(const ClientEntry& entry) {
  const bool held = entry.overrideSampling.value_or(1) > 0;
  const auto reports = [held](const std::optional<double>& threshold) {
    return threshold && (*threshold > 0 || held);
  };
  const auto& countries = entry.perCountrySamplingThresholds;
  const bool sampledIn =
      reports(entry.samplingThreshold) ||
      (countries && std::any_of(countries->begin(), countries->end(),
                                [&](const config::CountryThreshold& row) { return reports(row.threshold); }));
  const bool address = !recipientOf(entry.postURL).empty() || !recipientOf(entry.realtimePostURL).empty();
  return entry.filters && !entry.localeWhitelist.texts.empty() && address &&
         (sampledIn || entry.hierarchy != 0);
}

// "events go to a.example"
std::string destinationText(const ClientEntry& entry) {
  const std::string host = recipientOf(entry.postURL);
  return host.empty() ? "realtime events go to " + recipientOf(entry.realtimePostURL)
                      : "events go to " + host;
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

class ClientsDiff {
 public:
  ClientsDiff(const Array& before, const Array& now, ChangePlace at, std::vector<Change>& changes)
      : _old(entriesIn(before)), _now(entriesIn(now)), _at(std::move(at)), _changes(changes) {}

  void compare() {
    pairUp();
    comparePairs();
    followClients();
    followSessionsWithoutUserInfo();
    sayUnpaired(true);
    sayUnpaired(false);
    sayOrder();
    sayIncomplete();
  }

 private:
  // The number of an entry in each list; nothing: none fits.
  using Move = std::pair<Number, Number>;
  // Who gets another entry, by name or text of a service.
  using Moves = std::map<Move, std::vector<std::string>>;
  struct Moved {
    Effect effect = Effect::other;
    std::vector<std::string> who;
    // The entries that they had before, or have now; nothing: none.
    std::set<Number> others;
  };

  void pairUp() {
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

  ChangeSink sinkAt(const WrittenEntry& entry, std::size_t number) const {
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

  void comparePairs() {
    for (std::size_t i = 0; i < _now.size(); ++i) {
      if (!_partnerOfNow[i]) continue;
      ChangeSink sink = sinkAt(_now[i], i);
      compareEntries(_old[*_partnerOfNow[i]], _now[i], whoIn(_now[i].entry, i), sink);
    }
  }

  Effect effectOf(const Move& move) const {
    const auto& [before, now] = move;
    if (!before) return now && letsOut(_now[*now].entry) ? Effect::more : Effect::other;
    if (!now) return letsOut(_old[*before].entry) ? Effect::less : Effect::other;
    std::vector<Change> changes;
    ChangeSink sink(changes, _at);
    compareEntries(_old[*before], _now[*now], "", sink);
    return worstOf(changes);
  }

  // Records the clients that get another entry than before.
  void follow(const std::string& who, const Move& move, Effect effect) {
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

  // The name of a service may hold several of the texts, and gets the first of their entries. Two of them
  // show every combination of an old and a new entry.
  void addNamesWithTwoTexts(Moves& moves) {
    Moves more;
    for (auto a = moves.begin(); a != moves.end(); ++a) {
      for (auto b = std::next(a); b != moves.end(); ++b) {
        const Move both(firstOf(a->first.first, b->first.first), firstOf(a->first.second, b->first.second));
        if (moves.contains(both)) continue;
        if (++_pairs > kMostPairs) return moves.merge(more);
        if (std::vector<std::string>& names = more[both]; names.empty())
          names.push_back(a->second.front() + " and " + b->second.front());
      }
    }
    moves.merge(more);
  }

  void followClients() {
    Names clients{kAnyOther}, services{kAnyOther};
    for (const auto* entries : {&_old, &_now}) {
      for (const WrittenEntry& one : *entries) {
        clients.merge(lowered(one.entry.client));
        services.merge(lowered(one.entry.service));
      }
    }
    std::map<Move, Effect> effects;
    for (const std::string& client : clients) {
      Moves moves;
      for (const std::string& service : services)
        moves[{entryFor(_old, client, service), entryFor(_now, client, service)}].push_back(service);
      addNamesWithTwoTexts(moves);
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

  // For these sessions, one entry decides where their events go and whether they contain the device's
  // identifier.
  void followSessionsWithoutUserInfo() {
    const Addresses before = addressesIn(_old), now = addressesIn(_now);
    if (before.post == now.post && before.realtime == now.realtime && before.extras == now.extras) return;
    Effect effect =
        std::min(effectOfAddress(before.post, now.post), effectOfAddress(before.realtime, now.realtime));
    if (before.extras != now.extras) effect = std::min(effect, now.extras ? Effect::more : Effect::less);
    follow("sessions that require no user info", {before.number, now.number}, effect);
  }

  // The other entries, in words: "phone and lamp"; empty: there is none.
  static std::string othersIn(const Moved& moved, const std::vector<WrittenEntry>& entries) {
    std::vector<std::string> others;
    for (const auto& other : moved.others)
      if (other) others.push_back(whoIn(entries[*other].entry, *other));
    return shownNames(std::move(others));
  }

  // The entries without a partner.
  void sayUnpaired(bool areNew) {
    const auto& entries = areNew ? _now : _old;
    const auto& partners = areNew ? _partnerOfNow : _partnerOfOld;
    for (std::size_t i = 0; i < entries.size(); ++i) {
      if (partners[i]) continue;
      const Moved& moved = areNew ? _added[i] : _removed[i];
      const WrittenEntry& entry = entries[i];
      std::string text = whoIn(entry.entry, i) + (areNew ? ": new entry" : ": the entry is gone");
      if (moved.who.empty()) text += areNew ? ", which nobody gets" : ", which nobody got";
      if (moved.others.contains(std::nullopt) && letsOut(entry.entry))
        text += (areNew ? ": " : ": no more ") + destinationText(entry.entry);
      if (const std::string others = othersIn(moved, areNew ? _old : _now); !others.empty())
        text += fmt::format("; {} that of {}", areNew ? "it comes before" : "its place is taken by", others);
      const std::optional<Value> none, given(entry.asGiven);
      sinkAt(entry, i).say(ChangeKind::entry, moved.effect, std::nullopt, areNew ? none : given,
                           areNew ? given : none, std::move(text));
    }
  }

  void sayOrder() {
    const auto number = [](std::size_t place) { return Value(static_cast<std::uint64_t>(place)); };
    for (const auto& [move, moved] : _moved) {
      const auto& [before, now] = move;
      sinkAt(_now[*now], *now)
          .say(ChangeKind::order, moved.effect, std::nullopt, number(*before), number(*now),
               fmt::format("{}: now the entry of {} applies, before it was that of {}", shownNames(moved.who),
                           whoIn(_now[*now].entry, *now), whoIn(_old[*before].entry, *before)));
    }
    std::vector<std::size_t> order;
    for (const auto& partner : _partnerOfOld)
      if (partner) order.push_back(*partner);
    if (!_moved.empty() || std::is_sorted(order.begin(), order.end())) return;
    ChangeSink(_changes, _at)
        .say(ChangeKind::order, Effect::other, std::nullopt, std::nullopt, std::nullopt,
             "the entries stand in another order, and every client keeps its own");
  }

  void sayIncomplete() {
    if (_pairs <= kMostPairs) return;
    ChangeSink(_changes, _at)
        .say(ChangeKind::order, Effect::more, std::nullopt, std::nullopt, std::nullopt,
             fmt::format(
                 "texts in \"service\" have other places: of names that hold two of them, only {} pairs "
                 "were compared, and more may leave",
                 kMostPairs));
  }

  const std::vector<WrittenEntry> _old;
  const std::vector<WrittenEntry> _now;
  const ChangePlace _at;
  std::vector<Change>& _changes;

  // The partner of each.
  std::vector<Number> _partnerOfOld;
  std::vector<Number> _partnerOfNow;
  // Who gets another entry, by the entry that is new, gone, or now the other one.
  std::map<std::size_t, Moved> _added;
  std::map<std::size_t, Moved> _removed;
  std::map<Move, Moved> _moved;
  // Pairs of texts that were compared; beyond the bound the result is incomplete.
  std::size_t _pairs = 0;
};

}  // namespace

void compareClients(const Array& before, const Array& now, const ChangePlace& at,
                    std::vector<Change>& changes) {
  ClientsDiff(before, now, at, changes).compare();
}

}  // namespace veltrad::storebag
