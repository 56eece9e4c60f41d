// SPDX-License-Identifier: Apache-2.0
// Compares two states of a client entry, key by key.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/value.h"
#include "config/client_entry.h"
#include "storebag/change.h"

namespace veltrad::storebag {

// A client entry, as the daemon reads it and as it is written.
struct WrittenEntry {
  explicit WrittenEntry(Dictionary given)
      : asGiven(std::move(given)), entry(config::parsed<config::ClientEntry>(asGiven)) {}

  Dictionary asGiven;
  config::ClientEntry entry;
};

// "phone and lamp (service ringer)"; an entry without "client" behind others is for "every other client".
std::string whoIn(const config::ClientEntry& entry, std::size_t number);

// Where events with this address would go: a host, or empty if they cannot be posted.
std::string recipientOf(const std::optional<std::string>& address);
Effect effectOfAddress(const std::optional<std::string>& before, const std::optional<std::string>& now);

class EntryDiff {
 public:
  // All outlive it. `who`: as in whoIn().
  EntryDiff(const WrittenEntry& before, const WrittenEntry& now, std::string who, ChangeSink& changes)
      : _old(before.entry),
        _now(now.entry),
        _oldGiven(before.asGiven),
        _nowGiven(now.asGiven),
        _who(std::move(who)),
        _changes(changes) {}

  void compare();

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

  void say(ChangeKind kind, Effect effect, const char* key, std::string text);
  void compareConsent();
  void compareCountries();
  void compareDevices();
  void compareFilters();
  void compareSampling();
  std::optional<SharesText> changedShares(const std::optional<double>& old,
                                          const std::optional<double>& now) const;
  bool freesHeld(const Thresholds& thresholds) const;
  std::map<std::string, Thresholds> countryThresholds() const;
  void compareCountryThresholds();
  void compareHeld();
  void compareIdentifiers();
  void compareAddresses();
  void compareBatching();

  const config::ClientEntry& _old;
  const config::ClientEntry& _now;
  const Dictionary& _oldGiven;
  const Dictionary& _nowGiven;
  const std::string _who;
  ChangeSink& _changes;
};

}  // namespace veltrad::storebag
