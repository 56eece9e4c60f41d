// SPDX-License-Identifier: Apache-2.0
// Reads the files of the history for questions on the control socket.
#include "daemon/history_answers.h"

#include <chrono>
#include <optional>

#include "support/history.h"
#include "support/history_file.h"

namespace veltrad::daemon {

namespace {

using namespace std::chrono_literals;
using support::HistoryFile;
using support::HistoryFolder;

// So that an answer fits into a frame.
constexpr std::size_t kMostRecords = 1000;
constexpr std::uint64_t kMostHeaderBytes = 384u << 10;
constexpr std::size_t kMostBodyBytes = 512u << 10;
// The disk may be slow, and a long history takes its time.
constexpr auto kDiskPatience = 20s;

struct Place {
  std::int64_t day = 0;
  std::uint64_t offset = 0;
};

Result<Place, std::string> placeIn(const Dictionary& arguments) {
  const std::string* name = arguments.string("day");
  const auto day = name ? HistoryFolder::dayNamed(*name) : std::nullopt;
  const Value* offset = arguments.find("offset");
  const auto number = offset ? offset->toInt64() : std::nullopt;
  if (!day || !number || *number < 0)
    return Failure{std::string("arguments \"day\" and \"offset\" must name a record")};
  return Place{*day, static_cast<std::uint64_t>(*number)};
}

}  // namespace

Result<Dictionary, std::string> historyPage(support::History& history, const Dictionary& arguments) {
  if (!history.writeNow(std::chrono::steady_clock::now() + kDiskPatience))
    return Failure{std::string("The disk takes too long to write what left just now.")};
  const auto days = HistoryFolder::days(history.directory());
  Place at;
  if (!arguments.empty()) {
    const auto place = placeIn(arguments);
    if (!place) return Failure{place.error()};
    at = place.value();
  }
  Array records;
  std::uint64_t bytes = 0;
  for (auto day = days.lower_bound(at.day); day != days.end(); ++day) {
    const std::string name = HistoryFolder::nameOf(day->first);
    const HistoryFile file(HistoryFolder::pathOf(history.directory(), day->first));
    for (auto place = file.at(day->first == at.day ? at.offset : 0); place; place = file.at(place->end())) {
      if (records.size() == kMostRecords || bytes > kMostHeaderBytes)
        return Dictionary{{"records", std::move(records)},
                          {"next", Dictionary{{"day", name}, {"offset", place->offset}}}};
      auto header = file.header(*place);
      if (!header) continue;
      bytes += place->headerBytes;
      header->set("day", name);
      header->set("offset", place->offset);
      records.push_back(std::move(*header));
    }
  }
  return Dictionary{{"records", std::move(records)}};
}

Result<Dictionary, std::string> historyBody(support::History& history, const Dictionary& arguments) {
  const auto named = placeIn(arguments);
  if (!named) return Failure{named.error()};
  const HistoryFile file(HistoryFolder::pathOf(history.directory(), named.value().day));
  const auto place = file.at(named.value().offset);
  const Value* from = arguments.find("from");
  const auto begin = from ? from->toInt64().value_or(0) : 0;
  if (!place || begin < 0) return Failure{std::string("There is no such record any more.")};
  if (begin == 0 && !file.isIntact(*place)) return Failure{std::string("This record is damaged.")};
  return Dictionary{{"bytes", Data{file.body(*place, static_cast<std::uint64_t>(begin), kMostBodyBytes)}},
                    {"size", place->bodyBytes}};
}

Result<Dictionary, std::string> purgeHistory(support::History& history) {
  const auto removed = history.purge(std::chrono::steady_clock::now() + kDiskPatience);
  if (!removed) return Failure{std::string("The disk takes too long; the history may still be there.")};
  return Dictionary{{"records", removed->records}, {"bytes", removed->bytes}, {"days", removed->days}};
}

}  // namespace veltrad::daemon
