// SPDX-License-Identifier: Apache-2.0
// Keeps the day's account. Any thread.
#include "config/daily_allowance.h"

#include <algorithm>
#include <utility>

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
  if (!fits(_account->events, events, rules.dailyEvents) || !fits(_account->bytes, bytes, rules.dailyBytes))
    return false;
  _account->events += events;
  _account->bytes += bytes;
  ++_version;
  return true;
}

void DailyAllowance::giveBack(std::uint64_t events, std::uint64_t bytes) {
  const Lock held(_mutex);
  beginDay();
  _account->events -= std::min(_account->events, events);
  _account->bytes -= std::min(_account->bytes, bytes);
  ++_version;
}

void DailyAllowance::countIn(platform::DayAccount& account) {
  const Lock held(_mutex);
  _account = &account;
  _before = account;
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
  const auto number = [kept](const char* key) {
    const Value* value = kept ? kept->find(key) : nullptr;
    return static_cast<std::uint64_t>(value ? value->toInt64().value_or(0) : 0);
  };
  const Lock held(_mutex);
  _loaded = true;
  beginDay();
  if (number("day") != static_cast<std::uint64_t>(_account->day)) return;
  // Added to what has left since the start, unless the account has begun with it.
  const bool today = _before.day == _account->day;
  _account->events += number("events") - std::min(number("events"), today ? _before.events : 0);
  _account->bytes += number("bytes") - std::min(number("bytes"), today ? _before.bytes : 0);
}

void DailyAllowance::beginDay() {
  const auto today = static_cast<std::int64_t>(platform::timevalToSeconds(_clock.now())) / kSecondsADay;
  if (today != _account->day) *_account = {today, 0, 0};
}

std::string DailyAllowance::text() const {
  const Lock held(_mutex);
  return formats::writeJSON(
             Dictionary{{"day", _account->day}, {"events", _account->events}, {"bytes", _account->bytes}}) +
         "\n";
}

std::uint64_t DailyAllowance::version() const {
  const Lock held(_mutex);
  return _version;
}

}  // namespace veltrad::config
