// SPDX-License-Identifier: Apache-2.0
// The effect of a storebag on a session, as the daemon's own code decides it.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "backends/client_match.h"
#include "storebag/given.h"
#include "wire/fates.h"

namespace veltrad::storebag {

struct MessageFate {
  wire::Fate fate = wire::Fate::none;
  std::optional<std::string> url;
};

// An event that leaves. Values that only a run determines are NaN.
struct LeavingEvent {
  Dictionary fields;
  // Its message, from 1; 0 is the start message.
  std::size_t message = 0;
  // Names of the message's fields and of the user info's.
  std::set<std::string> removed, hashed;
};

// Its 15 fields are those of the JSON form.
struct BackendExplanation {
  // Before the messages; absent: the back end is not made.
  std::optional<std::int32_t> state;
  wire::Reason reason = wire::Reason::always;
  backends::ClientMatch match;
  std::optional<double> threshold;
  // The share of devices that report.
  double chance = 0;
  std::int32_t hierarchy = 0;
  bool batched = false;
  std::optional<std::int32_t> eventThreshold;
  std::optional<std::string> url, realtimeUrl;
  // In the order of the messages.
  std::vector<LeavingEvent> events;
  // One a message.
  std::vector<MessageFate> fates;
  // The names of removed and hashed fields of all events and datagrams.
  std::set<std::string> removed, hashed;
  // The texts of the datagrams, one for each message.
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
