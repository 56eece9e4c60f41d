// SPDX-License-Identifier: Apache-2.0
// Counts, and reads and writes the counts.
#include "config/destinations.h"

#include <algorithm>
#include <cstdlib>
#include <vector>

#include "formats/json.h"
#include "http/host_name.h"
#include "platform/clock.h"
#include "platform/file_store.h"

namespace veltrad::config {

namespace {

constexpr std::size_t kLargestDestinationsFile = 16u << 20;
// In an answer, which is to fit a frame.
constexpr std::size_t kMostShown = 1024;
constexpr const char* kOther = "other";
constexpr std::int64_t kSecondsOfAnHour = 3'600;
constexpr std::int64_t kHours = 24;

}  // namespace

std::int64_t Destinations::hour() const {
  return _clock.now().seconds / kSecondsOfAnHour;
}

void Destinations::forgetOld() {
  _hours.erase(_hours.begin(), _hours.upper_bound(hour() - kHours));
}

Destinations::Counts& Destinations::countsOf(std::int64_t hour, std::string_view address) {
  ByAddress& all = _hours[hour];
  const auto found = all.find(address);
  if (found != all.end()) return found->second;
  return all[all.size() < kMost ? std::string(address) : kOther];
}

void Destinations::count(http::Departure::Kind kind, std::string_view to, std::uint64_t events,
                         std::uint64_t bytes) {
  using Kind = http::Departure::Kind;
  constexpr Column kColumnOf[] = {Column::events, datagrams, files, logData};
  static_assert(static_cast<int>(Kind::logData) == 3);
  const std::string_view address = http::addressOf(to).substr(0, http::kMostOfAddress);
  const std::int64_t now = hour();
  const Lock held(_mutex);
  if (_hours.empty() || _hours.rbegin()->first != now) forgetOld();
  Counts& counts = countsOf(now, address);
  counts[kColumnOf[static_cast<std::size_t>(kind)]] += events;
  counts[Column::bytes] += bytes;
  ++_version;
}

void Destinations::load() {
  {
    const Lock held(_mutex);
    if (_loaded) return;
  }
  const auto read = _files.read(_path, kLargestDestinationsFile);
  if (!read && read.error().passes()) return;
  const auto parsed = formats::parseJSON(read ? read.value() : "{}");
  const Dictionary* kept = parsed ? parsed.value().asDictionary() : nullptr;
  const Lock held(_mutex);
  _loaded = true;
  for (const auto& [text, byAddress] : kept ? *kept : Dictionary()) {
    const std::int64_t then = std::strtoll(text.c_str(), nullptr, 10);
    if (then > hour() || !byAddress.asDictionary()) continue;
    for (const auto& [address, row] : *byAddress.asDictionary()) {
      const Array* numbers = row.asArray();
      if (!numbers || numbers->size() != columns) continue;
      Counts& counts = countsOf(then, address);
      for (std::size_t i = 0; i < columns; ++i)
        counts[i] += static_cast<std::uint64_t>((*numbers)[i].toInt64().value_or(0));
    }
  }
  forgetOld();
}

// Keeps the destinations with the most bytes.
void Destinations::joinSmallest(ByAddress& sums) {
  if (sums.size() <= kMostShown) return;
  std::vector<ByAddress::const_iterator> order;
  for (auto at = sums.cbegin(); at != sums.cend(); ++at) order.push_back(at);
  const auto last = order.begin() + (kMostShown - 1);
  std::nth_element(order.begin(), last, order.end(), [](const auto& a, const auto& b) {
    return a->second[Column::bytes] > b->second[Column::bytes];
  });
  Counts others{};
  for (auto at = last; at != order.end(); ++at) {
    for (std::size_t i = 0; i < columns; ++i) others[i] += (*at)->second[i];
    sums.erase(*at);
  }
  Counts& other = sums[kOther];
  for (std::size_t i = 0; i < columns; ++i) other[i] += others[i];
}

Array Destinations::lastDay() const {
  ByAddress sums;
  {
    const Lock held(_mutex);
    for (auto at = _hours.upper_bound(hour() - kHours); at != _hours.end(); ++at) {
      for (const auto& [address, counts] : at->second) {
        for (std::size_t i = 0; i < columns; ++i) sums[address][i] += counts[i];
      }
    }
  }
  joinSmallest(sums);
  Array all;
  for (const auto& [address, counts] : sums) {
    Dictionary line{{"to", address}};
    for (std::size_t i = 0; i < columns; ++i) line.set(kColumns[i], counts[i]);
    all.push_back(std::move(line));
  }
  return all;
}

std::string Destinations::text() const {
  Dictionary all;
  const Lock held(_mutex);
  for (const auto& [then, byAddress] : _hours) {
    Dictionary rows;
    for (const auto& [address, counts] : byAddress) rows.set(address, Array(counts.begin(), counts.end()));
    all.set(std::to_string(then), std::move(rows));
  }
  return formats::writeJSON(all) + "\n";
}

std::uint64_t Destinations::version() const {
  const Lock held(_mutex);
  return _version;
}

}  // namespace veltrad::config
