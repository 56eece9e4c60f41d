// SPDX-License-Identifier: Apache-2.0
// Writes an explanation as JSON and as readable text.
#include <fmt/format.h>

#include "base/null_value.h"
#include "formats/json.h"
#include "storebag/explanation.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

template <typename List>
Array arrayOf(const List& items) {
  Array array;
  for (const auto& item : items) array.emplace_back(item);
  return array;
}

Array fatesOf(const BackendExplanation& told) {
  Array array;
  for (const MessageFate& message : told.fates)
    array.emplace_back(Dictionary{{"fate", wire::nameOf(message.fate)}, {"url", orNull(message.url)}});
  return array;
}

std::vector<std::string> differencesOf(const backends::ClientMatch& match) {
  std::vector<std::string> differs;
  if (match.clientDiffers) differs.emplace_back("client");
  if (match.serviceDiffers) differs.emplace_back("service");
  return differs;
}

std::string headline(const std::string& name, const BackendExplanation& told) {
  if (!told.state) return fmt::format("{}: is not made: {}", name, wire::causeOf(told.reason));
  static constexpr const char* kStates[] = {"waits", "does not report", "reports", "holds its events"};
  return fmt::format("{}: {} (state {}): {} ({})", name, kStates[*told.state], *told.state,
                     wire::causeOf(told.reason), wire::entryOf(told.reason).name);
}

std::string entryLine(const backends::ClientMatch& match) {
  if (match.entry) return fmt::format("  entry clients[{}]\n", *match.entry);
  if (!match.nearest) return "";
  return fmt::format("  no entry fits; the nearest is clients[{}], whose {} {}\n", *match.nearest,
                     listedWithAnd(differencesOf(match)),
                     match.clientDiffers && match.serviceDiffers ? "differ" : "differs");
}

std::string backendText(const std::string& name, const BackendExplanation& told) {
  std::string text = headline(name, told) + "\n" + entryLine(told.match);
  if (!told.state) return text;
  text += fmt::format("  {:.4g} % of devices report", told.chance * 100);
  if (told.threshold) text += fmt::format(" (threshold {})", *told.threshold);
  text += "\n";
  if (told.url) text += fmt::format("  to {}\n", *told.url);
  if (told.realtimeUrl && told.realtimeUrl != told.url)
    text += fmt::format("  realtime events to {}\n", *told.realtimeUrl);
  if (told.batched)
    text +=
        fmt::format("  in batches, flushed above {} events of a method\n", told.eventThreshold.value_or(0));
  if (!told.removed.empty()) text += fmt::format("  removed: {}\n", listed(told.removed));
  if (!told.hashed.empty()) text += fmt::format("  hashed: {}\n", listed(told.hashed));
  for (std::size_t i = 0; i < told.fates.size(); ++i)
    text += fmt::format("  message {}: {}{}\n", i + 1, wire::nameOf(told.fates[i].fate),
                        i < told.texts.size() ? " \"" + told.texts[i] + "\"" : "");
  for (const LeavingEvent& event : told.events)
    text += fmt::format("  leaves: {}\n", formats::writeJSON(event.fields));
  return text;
}

}  // namespace

Dictionary asDictionary(const BackendExplanation& told) {
  Value nearest = nullValue();
  if (told.match.nearest)
    nearest = Dictionary{{"entry", *told.match.nearest}, {"differs", arrayOf(differencesOf(told.match))}};
  Array events;
  for (const LeavingEvent& event : told.events) events.emplace_back(event.fields);
  return {{"state", orNull(told.state)},
          {"reason", wire::entryOf(told.reason).name},
          {"entry", orNull(told.match.entry)},
          {"nearest", nearest},
          {"threshold", orNull(told.threshold)},
          {"chance", told.chance},
          {"hierarchy", told.hierarchy},
          {"batched", told.batched},
          {"eventThreshold", orNull(told.eventThreshold)},
          {"url", orNull(told.url)},
          {"realtimeUrl", orNull(told.realtimeUrl)},
          {"events", std::move(events)},
          {"fates", fatesOf(told)},
          {"removed", arrayOf(told.removed)},
          {"hashed", arrayOf(told.hashed)},
          {"texts", arrayOf(told.texts)}};
}

Dictionary asDictionary(const Explanation& explanation) {
  Dictionary backends;
  for (const auto& [name, told] : explanation.backends) backends.set(name, asDictionary(told));
  return {{"storebag", orNull(explanation.storebag)},
          {"version", orNull(explanation.version)},
          {"section", orNull(explanation.section)},
          {"backends", backends}};
}

std::string textOf(const Explanation& explanation) {
  if (!explanation.storebag)
    return "Nothing is reported: this client type has no storebag; --client-type 5 to 17 have one.\n";
  if (!explanation.section) return "Nothing is reported: the storebag has no section for this environment.\n";
  std::string text = fmt::format("storebag {}, version {}, section {}\n", *explanation.storebag,
                                 explanation.version.value_or("none"), *explanation.section);
  if (explanation.backends.empty()) text += "Nothing is reported: the section has no back ends.\n";
  for (const auto& [name, told] : explanation.backends) text += "\n" + backendText(name, told);
  return text;
}

}  // namespace veltrad::storebag
