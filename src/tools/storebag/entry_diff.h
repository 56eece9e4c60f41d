// SPDX-License-Identifier: Apache-2.0
// Compares two states of a client entry, key by key.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <utility>

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

// `who`: as in whoIn().
void compareEntries(const WrittenEntry& before, const WrittenEntry& now, const std::string& who,
                    ChangeSink& changes);

}  // namespace veltrad::storebag
