// SPDX-License-Identifier: Apache-2.0
// Describes departures in readable text. Pure functions; any thread.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "tools/ctl/history_client.h"

namespace veltrad::ctl {

// "2026-11-26 00:12:03" in local time.
std::string timeText(double secondsSince1970);
// One line: ID, time, what, where to, whose, how it ended.
std::string lineOfItem(const HistoryItem& item);
// "HTTP 200", "sent 5 times, not acknowledged", "the outcome is not known".
std::string outcomeOf(const HistoryItem& item);
// "2 events", "a file".
std::string whatOf(const HistoryItem& item);
// "phone/ringer", or the client type without names.
std::string whoseOf(const HistoryItem& item);
// The other details of it, by name, as readable text.
std::vector<std::pair<std::string, std::string>> detailsOf(const HistoryItem& item);
// All details of it, and its header lines.
std::string headOfItem(const HistoryItem& item);
// The text for an item whose body was not kept.
std::string withoutBody(const HistoryItem& item);

}  // namespace veltrad::ctl
