// SPDX-License-Identifier: Apache-2.0
// The input of a simulation: the devices, their settings and storebag, the servers, and incidents.
#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "base/value.h"
#include "config/client_entry.h"
#include "config/operator_settings.h"

namespace veltrad::simulate {

// One version of the storebag that all devices use.
struct Bag {
  std::optional<std::int64_t> refreshCycle;
  config::ClientEntry entry;  // the first one of "httppost"
  bool reliable = false;      // "dashboard": acknowledgements and retransmission
  std::chrono::milliseconds period{500};
};

struct Incident {
  enum class What { storebagsDown, collectorAnswers, dashboardsDown, powerCut, push };
  What what = What::storebagsDown;
  // In seconds.
  double at = 0;
  double lasts = 0;
  int status = 503;  // collectorAnswers; 0: nobody answers
  std::int64_t retryAfter = 0;
  double share = 1;        // powerCut: of the devices
  double bootsWithin = 0;  // seconds, spread evenly
  std::size_t bag = 0;     // push: its number
};

// Its 16 fields are what a scenario says; the defaults stand here.
struct Scenario {
  std::uint32_t devices = 1'000'000;
  double hours = 8;
  std::uint64_t seed = 1;
  config::OperatorChoices settings;  // settings.json of every device
  std::vector<Bag> bags;             // the first is the one that all have at the start
  std::string cacheControl = "max-age=3600";
  bool conditional = true;  // the storebag server answers 304 where nothing is new

  double messagesPerHour = 6;    // of the session that stays open, at random
  double sessionsPerHour = 0.5;  // others, at random
  double sessionSeconds = 300;   // the length of these
  std::uint16_t messagesPerSession = 4;
  double upDays = 7;              // since the last start, at most, when the simulation begins
  double lossOfDatagrams = 0.01;  // each way
  double timeout = 10;            // seconds until an exchange with a server that is down fails
  double keepAlive = 75;          // seconds for which a server keeps an idle connection
  std::vector<Incident> incidents;

  double jitter() const { return settings.jitter.value_or(0); }
};

// The error is one line that names what is wrong and what was expected.
Result<Scenario, std::string> scenarioFrom(const Dictionary& given);

}  // namespace veltrad::simulate
