// SPDX-License-Identifier: Apache-2.0
// Writes changes as JSON and as readable text.
#include <fmt/format.h>

#include "base/null_value.h"
#include "storebag/storebag_diff.h"

namespace veltrad::storebag {
namespace {

std::string pathOf(const ChangePlace& at) {
  std::string path = at.section.value_or("");
  if (at.backend) path += "." + *at.backend;
  if (at.entry) path += fmt::format(".clients[{}]", *at.entry);
  return path.empty() ? "" : path + ": ";
}

std::size_t countOf(const std::vector<Change>& changes, Effect effect) {
  std::size_t count = 0;
  for (const Change& change : changes) count += change.effect == effect ? 1 : 0;
  return count;
}

std::string messagesText(const MessageChanges& messages) {
  std::string text =
      fmt::format("{} of {} messages {} another fate{}\n", messages.changed.size(), messages.total,
                  messages.changed.size() == 1 ? "has" : "have", messages.changed.empty() ? "" : ":");
  for (const ChangedMessage& one : messages.changed)
    text += fmt::format("  line {}\n    was {}\n    is  {}\n", one.line, one.was, one.is);
  return text;
}

Dictionary changeAsDictionary(const Change& change) {
  return {{"kind", nameOf(change.kind)},
          {"effect", nameOf(change.effect)},
          {"section", orNull(change.at.section)},
          {"backend", orNull(change.at.backend)},
          {"client", orNull(change.at.client)},
          {"service", orNull(change.at.service)},
          {"entry", orNull(change.at.entry)},
          {"key", orNull(change.key)},
          {"old", orNull(change.before)},
          {"new", orNull(change.now)},
          {"text", change.text}};
}

Value messagesAsValue(const std::optional<MessageChanges>& messages) {
  if (!messages) return nullValue();
  Array list;
  for (const ChangedMessage& one : messages->changed)
    list.emplace_back(Dictionary{{"line", one.line}, {"was", one.was}, {"is", one.is}});
  return Dictionary{
      {"total", messages->total}, {"changed", messages->changed.size()}, {"list", std::move(list)}};
}

}  // namespace

Dictionary asDictionary(const StorebagDiff& diff) {
  Array changes;
  for (const Change& change : diff.changes) changes.emplace_back(changeAsDictionary(change));
  return {{"changes", std::move(changes)}, {"messages", messagesAsValue(diff.messages)}};
}

std::string textOf(const StorebagDiff& diff) {
  static constexpr const char* kMarks[] = {"MORE ", "less ", "other"};
  std::string text;
  for (const Change& change : diff.changes)
    text += fmt::format("{}  {}{}\n", kMarks[static_cast<std::size_t>(change.effect)], pathOf(change.at),
                        change.text);
  const std::size_t more = countOf(diff.changes, Effect::more), less = countOf(diff.changes, Effect::less);
  text += diff.changes.empty()
              ? "no changes\n"
              : fmt::format("{} {}: {} by which more leaves devices, {} by which less does\n",
                            diff.changes.size(), diff.changes.size() == 1 ? "change" : "changes", more, less);
  return diff.messages ? text + messagesText(*diff.messages) : text;
}

}  // namespace veltrad::storebag
