// SPDX-License-Identifier: Apache-2.0
// Evaluates the sessions of a recording with two states of a storebag and compares the fate of each message.
#include <fmt/format.h>

#include <algorithm>
#include <map>
#include <set>

#include "backends/backend.h"
#include "config/client_types.h"
#include "formats/json.h"
#include "storebag/explanation.h"
#include "storebag/storebag_diff.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

// A session's messages, by their places in the recording.
struct Session {
  Given given;
  std::vector<std::size_t> places;
};

std::vector<Session> sessionsIn(const Given& given, const std::vector<RecordedMessage>& messages) {
  std::vector<Session> sessions;
  std::map<std::string, std::size_t> known;
  for (std::size_t i = 0; i < messages.size(); ++i) {
    const RecordedMessage& one = messages[i];
    const auto [at, isNew] = known.emplace(formats::writeJSON(one.session), sessions.size());
    if (isNew) {
      sessions.push_back({given, {}});
      takeSession(one.session, sessions.back().given);
    }
    sessions[at->second].given.messages.push_back(one.message);
    sessions[at->second].places.push_back(i);
  }
  return sessions;
}

// A storebag that says its name is for clients of that name alone.
bool isFor(const Dictionary& storebag, std::int32_t clientType) {
  const std::string* own = storebag.string("name");
  const char* name = config::storebagNameForClientType(clientType);
  return !own || (name && *own == name);
}

std::string fateOf(const BackendExplanation& told, std::size_t message) {
  const MessageFate& fate = told.fates[message];
  std::string text(wire::nameOf(fate.fate));
  const bool reports = told.state == backends::kBackendReporting;
  if (fate.fate == wire::Fate::dropped && !reports)
    return fmt::format("{} ({})", text, wire::entryOf(told.reason).name);
  if (fate.url) text += " to " + *fate.url;
  for (const LeavingEvent& event : told.events) {
    if (event.message != message + 1) continue;
    if (!event.removed.empty()) text += ", without " + listed(event.removed);
    if (!event.hashed.empty()) text += ", with hashed " + listed(event.hashed);
  }
  return text;
}

// Compares the fates in the back ends that differ.
ChangedMessage compareFates(const Explanation& before, const Explanation& now, std::size_t message) {
  std::set<std::string> names;
  for (const auto* told : {&before, &now})
    for (const auto& [name, backend] : told->backends) names.insert(name);
  ChangedMessage changed;
  const auto fateIn = [message](const Explanation& told, const std::string& name) {
    const auto at = told.backends.find(name);
    return at == told.backends.end() ? std::string("none") : fateOf(at->second, message);
  };
  for (const std::string& name : names) {
    const std::string was = fateIn(before, name), is = fateIn(now, name);
    if (was == is) continue;
    const char* join = changed.was.empty() ? "" : "; ";
    changed.was += fmt::format("{}{}: {}", join, name, was);
    changed.is += fmt::format("{}{}: {}", join, name, is);
  }
  return changed;
}

}  // namespace

MessageChanges messageChangesOf(const Dictionary& before, const Dictionary& now, const Given& given,
                                const std::vector<RecordedMessage>& messages) {
  MessageChanges changes{messages.size(), {}};
  for (const Session& session : sessionsIn(given, messages)) {
    if (!isFor(before, session.given.clientType) || !isFor(now, session.given.clientType)) continue;
    const Explanation old = explain(before, session.given), current = explain(now, session.given);
    for (std::size_t i = 0; i < session.places.size(); ++i) {
      ChangedMessage changed = compareFates(old, current, i);
      if (changed.was.empty()) continue;
      changed.line = messages[session.places[i]].line;
      changes.changed.push_back(std::move(changed));
    }
  }
  std::sort(changes.changed.begin(), changes.changed.end(),
            [](const ChangedMessage& a, const ChangedMessage& b) { return a.line < b.line; });
  return changes;
}

}  // namespace veltrad::storebag
