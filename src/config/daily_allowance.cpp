// SPDX-License-Identifier: Apache-2.0
// Keeps the day's account. Any thread.
#include "config/daily_allowance.h"

#include <algorithm>

#include "formats/json.h"
#include "platform/clock.h"
#include "platform/file_store.h"

namespace veltrad::config {

namespace {
constexpr std::size_t kLargestFile = 4096;
constexpr std::int64_t kSecondsADay = 86'400;

bool fits(std::uint64_t counted, std::uint64_t more, const std::optional<std::int64_t>& most) {
  return !most || (counted <= static_cast<std::uint64_t>(*most) &&
                   more <= static_cast<std::uint64_t>(*most) - counted);
}
}  // namespace

bool DailyAllowance::take(const PolicyRules& rules, std::uint64_t events, std::uint64_t bytes) {
  const Lock held(_mutex);
  const bool limited = rules.dailyEvents || rules.dailyBytes;
  if (!_loaded && limited) return false;
  beginDay();
  if (!fits(_events, events, rules.dailyEvents) || !fits(_bytes, bytes, rules.dailyBytes)) return false;
  _events += events;
  _bytes += bytes;
  ++_version;
  return true;
}

void DailyAllowance::giveBack(std::uint64_t events, std::uint64_t bytes) {
  const Lock held(_mutex);
  beginDay();
  _events -= std::min(_events, events);
  _bytes -= std::min(_bytes, bytes);
  ++_version;
}

void DailyAllowance::load() {
  {
    const Lock held(_mutex);
    if (_loaded) return;
  }
  const auto read = _files.read(_path, kLargestFile);
  if (!read && read.error().passes()) return;
  const auto parsed = read ? formats::parseJSON(read.value()) : formats::parseJSON("{}");
  const Dictionary* kept = parsed ? parsed.value().asDictionary() : nullptr;
  const auto number = [kept](const char* key) -> std::int64_t {
    const Value* value = kept ? kept->find(key) : nullptr;
    return value ? value->toInt64().value_or(0) : 0;
  };
  const Lock held(_mutex);
  _loaded = true;
  beginDay();
  if (number("day") != _day) return;
  // Added to what has left since the start.
  _events += static_cast<std::uint64_t>(number("events"));
  _bytes += static_cast<std::uint64_t>(number("bytes"));
}

void DailyAllowance::beginDay() {
  const auto today = static_cast<std::int64_t>(platform::timevalToSeconds(_clock.now())) / kSecondsADay;
  if (today == _day) return;
  _day = today;
  _events = _bytes = 0;
}

std::string DailyAllowance::text() const {
  const Lock held(_mutex);
  return formats::writeJSON(Dictionary{{"day", _day}, {"events", _events}, {"bytes", _bytes}}) + "\n";
}

std::uint64_t DailyAllowance::version() const {
  const Lock held(_mutex);
  return _version;
}

}  // namespace veltrad::config
