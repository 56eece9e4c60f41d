// SPDX-License-Identifier: Apache-2.0
// What a storebag does for a session, as the daemon's own code decides it.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "storebag/given.h"
#include "wire/fates.h"

namespace veltrad::storebag {

// A client entry that does not fit, and by what.
struct NearestEntry {
  std::size_t entry = 0;
  std::vector<std::string> differs;
};

struct MessageFate {
  wire::Fate fate = wire::Fate::none;
  std::optional<std::string> url;
};

// Its 17 fields are those of the JSON form and which message an event is of.
struct BackendExplanation {
  // Before the messages; absent: the back end is not made.
  std::optional<std::int32_t> state;
  wire::Reason reason = wire::Reason::always;
  std::optional<std::size_t> entry;
  std::optional<NearestEntry> nearest;
  std::optional<double> threshold;
  // The share of devices that report.
  double chance = 0;
  std::int32_t hierarchy = 0;
  bool batched = false;
  std::optional<std::int32_t> eventThreshold;
  std::optional<std::string> url, realtimeUrl;
  // Those that leave, in the order of the messages. NaN stands for what only a run knows.
  std::vector<Dictionary> events;
  // From 1; 0 is the start message.
  std::vector<std::size_t> messageOfEvent;
  // One a message.
  std::vector<MessageFate> fates;
  // Names of fields.
  std::set<std::string> removed, hashed;
  // Of the datagrams, one a message.
  std::vector<std::string> texts;
};

struct Explanation {
  // Absent: the client type has none.
  std::optional<std::string> storebag;
  std::optional<std::string> version;
  // Absent: there is none for the environment, and no back end is made.
  std::optional<std::string> section;
  std::map<std::string, BackendExplanation> backends;
};

Explanation explain(const Dictionary& storebag, const Given& given);

Dictionary asDictionary(const Explanation& explanation);
Dictionary asDictionary(const BackendExplanation& backend);
// For people.
std::string textOf(const Explanation& explanation);

}  // namespace veltrad::storebag
