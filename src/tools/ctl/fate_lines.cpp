// SPDX-License-Identifier: Apache-2.0
// Makes the JSON of `veltractl why` and `watch`.
#include "tools/ctl/fate_lines.h"

#include <cmath>

namespace veltrad::ctl {

namespace {
template <typename T>
Value valueOrNull(const std::optional<T>& value) {
  return value ? Value(*value) : nullValue();
}

template <typename T>
Value valueIfKnown(std::uint8_t known, std::uint8_t which, T value) {
  return (known & which) != 0 ? Value(value) : nullValue();
}

Value reasonOrNull(const std::optional<wire::Reason>& reason) {
  return reason ? Value(wire::entryOf(*reason).name) : nullValue();
}

template <typename Names>
Array arrayOf(const Names& names) {
  Array array;
  for (const std::string& name : names) array.push_back(Value(name));
  return array;
}

Value numberOrNull(std::uint64_t number) {
  return number == 0 ? nullValue() : Value(number);
}

Value nearestOf(const wire::StandingEntry& standing) {
  if (standing.nearest < 0) return nullValue();
  Array differs;
  if ((standing.differs & wire::StandingEntry::clientDiffers) != 0) differs.push_back("client");
  if ((standing.differs & wire::StandingEntry::serviceDiffers) != 0) differs.push_back("service");
  return Dictionary{{"entry", standing.nearest}, {"differs", std::move(differs)}};
}

Dictionary lineOfBackend(const support::BackendFate& fate, const std::vector<support::ToldStep>& before) {
  Array road;
  for (const support::ToldStep& step : before) road.push_back(lineOfStep(step));
  for (const support::ToldStep& step : fate.road) road.push_back(lineOfStep(step));
  Dictionary line{{"fate", wire::nameOf(fate.fate)},
                  {"fateReason", reasonOrNull(fate.reason)},
                  {"eventNumber", fate.eventNumber ? Value(unsigned{*fate.eventNumber}) : nullValue()},
                  {"removed", arrayOf(fate.removed)},
                  {"hashed", arrayOf(fate.hashed)},
                  {"batch", numberOrNull(fate.batch)},
                  {"post", numberOrNull(fate.post)},
                  {"url", valueOrNull(fate.url)},
                  {"bytes", numberOrNull(fate.bytes)},
                  {"events", numberOrNull(fate.events)},
                  {"status", valueOrNull(fate.status)},
                  {"transmissions", fate.transmissions},
                  {"road", std::move(road)}};
  if (!fate.standing) {
    line.merge({{"state", nullValue()},
                {"reason", reasonOrNull(fate.reason)},
                {"entry", nullValue()},
                {"nearest", nullValue()},
                {"draw", nullValue()},
                {"threshold", nullValue()}});
    return line;
  }
  const wire::StandingEntry& standing = *fate.standing;
  line.merge({{"state", int{standing.state}},
              {"reason", reasonOrNull(wire::reasonIn(standing.reason))},
              {"entry", standing.entry < 0 ? nullValue() : Value(standing.entry)},
              {"nearest", nearestOf(standing)},
              {"draw", standing.draw},
              {"threshold", standing.threshold}});
  return line;
}
}  // namespace

double secondsOf(std::int64_t time) {
  return static_cast<double>(time) / 1e6;
}

Dictionary lineOfStep(const support::ToldStep& step) {
  const wire::StepEntry& entry = step.entry;
  Dictionary line{{"time", secondsOf(entry.time)}, {"step", wire::nameOf(entry.step)}};
  if (const auto reason = wire::reasonIn(entry.reason)) line.set("reason", wire::entryOf(*reason).name);
  if (!step.names.empty()) line.set("fields", arrayOf(step.names));
  const bool kept = entry.step == wire::Step::kept;
  if (step.text) line.set(kept ? "error" : entry.step == wire::Step::aggregated ? "to" : "url", *step.text);
  if (entry.batch != 0) line.set("batch", entry.batch);
  if (entry.post != 0) line.set("post", entry.post);
  if (kept) line.set("nextTry", secondsOf(entry.time) + entry.bytes);
  if (entry.bytes != 0 && !kept) line.set("bytes", unsigned{entry.bytes});
  if (entry.events != 0) line.set("events", unsigned{entry.events});
  if (entry.step == wire::Step::answered) line.set("status", unsigned{entry.status});
  return line;
}

Dictionary lineOfMessage(const support::ToldMessage& message) {
  static constexpr const char* kFrom[] = {"client", "session", "oneShot"};
  static constexpr const char* kItems[] = {"message", "file", "logData"};
  using Message = wire::MessageEntry;
  using Session = wire::SessionEntry;
  const Message& entry = message.entry;
  const support::ToldSession& session = *message.session;
  const Session& of = session.entry;
  Dictionary line{
      {"message", entry.message & ~wire::kNoMessage},
      {"time", secondsOf(entry.time)},
      {"from", kFrom[static_cast<std::size_t>(entry.from)]},
      {"session", valueOrNull(session.session)},
      {"clientType", valueIfKnown(of.known, Session::clientTypeKnown, of.clientType)},
      {"sessionID", valueIfKnown(of.known, Session::sessionIDKnown, of.sessionID)},
      {"clientVersion", valueIfKnown(of.known, Session::clientVersionKnown, unsigned{of.clientVersion})},
      {"client", valueOrNull(session.client)},
      {"service", valueOrNull(session.service)},
      {"category", valueIfKnown(entry.known, Message::categoryKnown, unsigned{entry.category})},
      {"type", valueIfKnown(entry.known, Message::typeKnown, unsigned{entry.type})},
      {"flag", entry.flag},
      {"aggregatedTo", valueOrNull(message.aggregatedTo)},
      {"reason", reasonOrNull(wire::reasonIn(entry.reason))},
      {"storebag", nullValue()}};
  if (session.storebag) {
    line.set("storebag", Dictionary{{"name", *session.storebag},
                                    {"version", valueOrNull(session.version)},
                                    {"section", valueOrNull(session.section)}});
  }
  if (entry.item != Message::Item::message) line.set("kind", kItems[static_cast<std::size_t>(entry.item)]);
  return line;
}

Dictionary lineOfFates(const support::MessageFates& fates) {
  Dictionary line = lineOfMessage(fates.message);
  std::vector<Dictionary::Entry> backends;
  for (const auto& [name, fate] : fates.backends)
    backends.emplace_back(name, lineOfBackend(fate, fates.road));
  line.set("backends", Dictionary::fromEntries(std::move(backends)));
  return line;
}

}  // namespace veltrad::ctl
