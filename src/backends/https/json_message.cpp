// SPDX-License-Identifier: Apache-2.0
// Makes the envelope.
#include "backends/https/json_message.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>

#include "base/text.h"
#include "formats/json.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
enum class Fate { keep, toSeconds, remove };

Fate fateOf(const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
    case Value::Type::signedInteger:
    case Value::Type::unsignedInteger:
    case Value::Type::string:
      return Fate::keep;
    case Value::Type::real:
      return value.toDouble() ? Fate::keep : Fate::remove;
    case Value::Type::date:
      return Fate::toSeconds;
    case Value::Type::data:
    case Value::Type::array:
    case Value::Type::dictionary:
      return Fate::remove;
  }
  return Fate::remove;
}

// Limits the length of a log line.
constexpr std::size_t kMostPrinted = 1024;

std::string cut(const std::string& text) {
  if (text.size() <= kMostPrinted) return text;
  const std::string_view kept = withoutIncompleteEnd(std::string_view(text).substr(0, kMostPrinted));
  return fmt::format("{}… ({} bytes cut)", kept, text.size() - kept.size());
}

std::string printed(const Value& value) {
  if (const double* number = value.asReal()) return fmt::format("{}", *number);
  const formats::JSONExcerpt excerpt = formats::excerptOfJSON(value, kMostPrinted);
  return excerpt.leftOut == 0 ? excerpt.text
                              : fmt::format("{}… ({} bytes cut)", excerpt.text, excerpt.leftOut);
}
}  // namespace

double finiteOrMinusOne(double seconds) {
  return std::isfinite(seconds) ? seconds : -1.0;
}

bool fitsJSON(const Dictionary& event) {
  return std::all_of(event.begin(), event.end(),
                     [](const auto& entry) { return fateOf(entry.second) == Fate::keep; });
}

std::size_t restrictEventForJSON(Dictionary& event) {
  std::vector<Dictionary::Entry> changed;
  for (const auto& [key, value] : event) {
    const Fate fate = fateOf(value);
    if (fate == Fate::keep) continue;
    if (fate == Fate::remove) {
      logWarning(
          "HTTPSPostBackend(createMessageForPostAndLogging): Quillfen unable to handle key: %s, value: %s",
          cut(key).c_str(), printed(value).c_str());
    }
    changed.emplace_back(key, value);
  }
  // Changes are applied after the loop, which they would invalidate.
  std::size_t removed = 0;
  for (auto& [key, value] : changed) {
    if (const Date* date = value.asDate()) {
      event.set(key, finiteOrMinusOne(date->secondsSince1970));
    } else {
      event.erase(key);
      ++removed;
    }
  }
  return removed;
}

JSONMessage makeJSONMessage(double postTime, const std::string& clientID, std::vector<Dictionary> events,
                            bool wantPretty, std::size_t expectedBytes) {
  Array list;
  list.reserve(events.size());
  for (Dictionary& event : events) list.emplace_back(std::move(event));
  const Value envelope = Dictionary{
      {"clientId", clientID}, {"events", std::move(list)}, {"postTime", finiteOrMinusOne(postTime)}};
  JSONMessage message{formats::writeJSON(envelope, formats::JSONStyle::compact, expectedBytes), std::nullopt};
  if (wantPretty)
    message.pretty = formats::writeJSON(envelope, formats::JSONStyle::pretty,
                                        message.compact.size() + message.compact.size() / 2);
  return message;
}

}  // namespace veltrad::backends
