// SPDX-License-Identifier: Apache-2.0
// Checks what a device has posted, field by field.
#include "gateway/envelope.h"

#include <fmt/format.h>

#include <cmath>
#include <limits>

#include "gateway/clean_json.h"

namespace veltrad::gateway {

namespace {

// 2101-01-01 00:00:00 UTC.
constexpr double kEndOf2100 = 4'133'980'800;

// Describes the fault of the field; empty if there is none.
std::string faultOfField(const std::string& key, const Value& value) {
  if (key.size() > kMostKeyBytes)
    return fmt::format("a key of {} bytes, at most {} are taken", key.size(), kMostKeyBytes);
  switch (value.type()) {
    case Value::Type::array:
    case Value::Type::dictionary:
    case Value::Type::date:
    case Value::Type::data:
      return fmt::format("\"{}\" holds a nested value", key);
    case Value::Type::string:
      if ((key == "_sessionID" || key == "_sender") && value.asString()->size() > kMostIdentifierBytes)
        return fmt::format("\"{}\" has {} bytes, at most {} are taken", key, value.asString()->size(),
                           kMostIdentifierBytes);
      return "";
    default:
      return "";
  }
}

std::string faultOfEvent(const Value& value) {
  const Dictionary* event = value.asDictionary();
  if (!event) return "it is no object";
  for (const auto& [key, field] : *event) {
    if (std::string fault = faultOfField(key, field); !fault.empty()) return fault;
  }
  return "";
}

std::optional<std::string> textField(const Dictionary& event, std::string_view key) {
  const std::string* text = event.string(key);
  return text ? std::optional(*text) : std::nullopt;
}

std::optional<std::int32_t> integerField(const Dictionary& event, std::string_view key) {
  const Value* value = event.find(key);
  if (!value || !value->isNumber()) return std::nullopt;
  const std::optional<double> number = value->toDouble();
  if (!number || *number < std::numeric_limits<std::int32_t>::min() ||
      *number > std::numeric_limits<std::int32_t>::max() || *number != std::trunc(*number))
    return std::nullopt;
  return static_cast<std::int32_t>(*number);
}

std::vector<std::string> partsOf(const std::string& sessionID) {
  std::vector<std::string> parts;
  for (std::size_t at = 0; at <= sessionID.size();) {
    const std::size_t dot = std::min(sessionID.find('.', at), sessionID.size());
    parts.push_back(sessionID.substr(at, dot - at));
    at = dot + 1;
  }
  return parts;
}

}  // namespace

Result<Envelope, std::string> parseEnvelope(std::string text) {
  auto value = parseCleanJSON(std::move(text));
  if (!value) return Failure{"no JSON: " + value.error()};
  const Dictionary* fields = value.value().asDictionary();
  if (!fields) return Failure{std::string("an envelope is an object")};
  const std::string* clientID = fields->string("clientId");
  if (!clientID) return Failure{std::string("\"clientId\" is no text")};
  if (clientID->size() > kMostIdentifierBytes)
    return Failure{fmt::format("\"clientId\" has {} bytes, at most {} are taken", clientID->size(),
                               kMostIdentifierBytes)};
  const Array* events = fields->array("events");
  if (!events) return Failure{std::string("\"events\" is no array")};
  const Value* postTime = fields->find("postTime");
  if (postTime && !postTime->isNumber()) return Failure{std::string("\"postTime\" is no number")};
  Envelope envelope{*clientID, {}};
  envelope.events.reserve(events->size());
  for (const Value& event : *events) {
    if (const std::string fault = faultOfEvent(event); !fault.empty())
      return Failure{fmt::format("event {}: {}", envelope.events.size(), fault)};
    envelope.events.push_back(*event.asDictionary());
  }
  return envelope;
}

std::optional<double> columnTime(std::optional<double> seconds) {
  return seconds && *seconds >= 0 && *seconds < kEndOf2100 ? seconds : std::nullopt;
}

EventColumns columnsOf(const Dictionary& event) {
  EventColumns columns;
  columns.sender = textField(event, "_sender");
  const Value* session = event.find("_sessionID");
  if (session && !session->isBoolean()) columns.sessionID = session->toText();
  if (columns.sessionID) columns.sessionPath = partsOf(*columns.sessionID);
  columns.category = integerField(event, "_method");
  columns.type = integerField(event, "_status");
  columns.eventNumber = integerField(event, "_eventNumber");
  const Value* time = event.find("eventTime");
  if (time && time->isNumber()) columns.happened = columnTime(time->toDouble());
  return columns;
}

}  // namespace veltrad::gateway
