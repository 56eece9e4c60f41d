// SPDX-License-Identifier: Apache-2.0
// Writes the fates of messages as readable text.
#include "tools/ctl/fate_text.h"

#include <fmt/format.h>

#include <chrono>
#include <cmath>
#include <ctime>

#include "base/text.h"
#include "tools/ctl/status_report.h"

namespace veltrad::ctl {

namespace {
using wire::Step;

std::string why(std::optional<wire::Reason> reason) {
  return reason ? ": " + std::string(wire::causeOf(*reason)) : std::string();
}

template <typename Names>
std::string listed(const Names& names) {
  std::string text;
  for (const std::string& name : names) text += (text.empty() ? "" : ", ") + escapedForLog(name);
  return text;
}

std::string shown(const std::optional<std::string>& text) {
  return text ? escapedForLog(*text) : "(overwritten)";
}

std::string wordsOf(const support::ToldStep& step) {
  const wire::StepEntry& entry = step.entry;
  const auto reason = wire::reasonIn(entry.reason);
  switch (entry.step) {
    case Step::taken:
      return "taken in";
    case Step::aggregated:
      return "copied to the client of session " + shown(step.text);
    case Step::removed:
      return "fields removed: " + listed(step.names);
    case Step::hashed:
      return "fields hashed: " + listed(step.names);
    case Step::restored:
      return "fields as they were given: " + listed(step.names);
    case Step::batched:
      return fmt::format("put into batch {}", entry.batch);
    case Step::held:
      return entry.batch != 0
                 ? fmt::format("held in batch {} until the back end's state is decided", entry.batch)
                 : "held: the socket did not take it";
    case Step::flushed:
      return fmt::format("batch {} flushed", entry.batch);
    case Step::posted:
      return fmt::format("post {} of {} begun, {} bytes to {}", entry.post,
                         entry.events == 1 ? "one event" : fmt::format("{} events", entry.events),
                         entry.bytes, shown(step.text));
    case Step::answered:
      return fmt::format("answered with status {}{}", entry.status, why(reason));
    case Step::sent:
      return step.text ? "sent to " + shown(step.text) : "sent";
    case Step::again:
      return "sent again";
    case Step::acknowledged:
      return "acknowledged" + (reason == wire::Reason::acknowledged_by_number ? why(reason) : "");
    case Step::kept:
      return "kept in the spool: " + shown(step.text);
    case Step::given_up:
      return "given up" + why(reason);
    case Step::dropped:
      return "dropped" + why(reason);
    case Step::lost:
      return "lost" + why(reason);
    case Step::written:
      return "written to the energy log";
    case Step::delivered:
      return "handed to the adaptor";
    default:
      return std::string(wire::nameOf(entry.step));
  }
}

std::string keptText(const support::BackendFate& fate) {
  const auto now = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
  const double wait = static_cast<double>(fate.nextTry) / 1e6 - now;
  return "kept: " + escapedForLog(fate.keptFor) + "; next try " +
         (wait > 0 ? "in " + formatDuration(wait) : "at its turn");
}

// The current state of the message.
std::string endOf(const support::BackendFate& fate) {
  using wire::Fate;
  switch (fate.fate) {
    case Fate::none:
      return "takes no such message" + why(fate.reason);
    case Fate::held:
      return "held" + why(fate.reason);
    case Fate::batched:
      return fmt::format("waits in batch {} for a flush", fate.batch);
    case Fate::posted:
      return fate.status ? fmt::format("posted, status {}{}", *fate.status, why(fate.reason))
                         : "posted, not answered yet";
    case Fate::waiting:
      return "sent, not acknowledged yet" + why(fate.reason);
    case Fate::sent:
      return "sent; nobody acknowledges it" + why(fate.reason);
    case Fate::written:
      return "written to the energy log";
    case Fate::delivered:
      return "handed to the adaptor";
    case Fate::given_up:
      return "given up" + why(fate.reason);
    case Fate::kept:
      return keptText(fate);
    default:
      return std::string(wire::nameOf(fate.fate)) + why(fate.reason);
  }
}

// Why the back end is in its state.
std::string standingOf(const wire::StandingEntry& standing) {
  static constexpr const char* kStates[] = {"waits", "does not report", "reports", "is held back"};
  std::string text = fmt::format("state {}, it {}", standing.state,
                                 standing.state < std::size(kStates) ? kStates[standing.state] : "?");
  text += why(wire::reasonIn(standing.reason));
  if (standing.entry >= 0) text += fmt::format("; client entry {}", standing.entry);
  if (standing.nearest >= 0) {
    const bool client = (standing.differs & wire::StandingEntry::clientDiffers) != 0;
    const bool service = (standing.differs & wire::StandingEntry::serviceDiffers) != 0;
    text += fmt::format("; the nearest is entry {}, but for its {}", standing.nearest,
                        client && service ? "client and service"
                        : client          ? "client"
                                          : "service");
  }
  if (std::isfinite(standing.threshold))
    text += fmt::format("; drawn {:.4f}, threshold {:.4f}", standing.draw, standing.threshold);
  return text;
}

std::string nameOf(const support::ToldMessage& message) {
  static constexpr const char* kFrom[] = {"from", "by the session of", "one-shot from"};
  static constexpr const char* kItems[] = {"message", "file", "log data"};
  const wire::MessageEntry& entry = message.entry;
  const support::ToldSession& session = *message.session;
  std::string text =
      fmt::format("{} {} {} {}", kItems[static_cast<std::size_t>(entry.item)],
                  entry.message & ~wire::kNoMessage, kFrom[static_cast<std::size_t>(entry.from)],
                  session.client ? escapedForLog(*session.client) : "a client without a name");
  if (session.service) text += "/" + escapedForLog(*session.service);
  const std::uint8_t known = session.entry.known;
  if ((known & wire::SessionEntry::clientTypeKnown) != 0)
    text += fmt::format(", client type {}", session.entry.clientType);
  if ((known & wire::SessionEntry::sessionIDKnown) != 0)
    text += fmt::format(", session {}", session.entry.sessionID);
  if ((entry.known & wire::MessageEntry::categoryKnown) != 0)
    text += fmt::format(", category {}", entry.category);
  if ((entry.known & wire::MessageEntry::typeKnown) != 0) text += fmt::format(", type {}", entry.type);
  if (entry.flag != 0) text += fmt::format(", flag {}", entry.flag);
  if (session.storebag) {
    text += fmt::format(", storebag {}", escapedForLog(*session.storebag));
    if (session.version) text += " " + escapedForLog(*session.version);
    if (session.section) text += " (" + escapedForLog(*session.section) + ")";
  }
  return text;
}
}  // namespace

std::string timeOf(std::int64_t microseconds) {
  const std::time_t seconds = microseconds / 1'000'000;
  std::tm local{};
  ::localtime_r(&seconds, &local);
  char text[32];
  return {text, std::strftime(text, sizeof text, "%H:%M:%S", &local)};
}

std::string textOfMessage(const support::ToldMessage& message) {
  const std::int64_t time = message.entry.time;
  return fmt::format("{}.{:03} {}", timeOf(time), time / 1000 % 1000, nameOf(message));
}

std::string textOfStep(const support::ToldStep& step, std::string_view backend) {
  const std::int64_t time = step.entry.time;
  return fmt::format("{}.{:03} {}{}{}", timeOf(time), time / 1000 % 1000, backend,
                     backend.empty() ? "" : ": ", wordsOf(step));
}

std::string textOfFates(const support::MessageFates& fates) {
  std::string text = textOfMessage(fates.message);
  if (const auto reason = wire::reasonIn(fates.message.entry.reason))
    text += "\n  reached no back end" + why(reason);
  for (std::size_t i = 1; i < fates.road.size(); ++i) text += "\n  " + textOfStep(fates.road[i], {});
  for (const auto& [name, fate] : fates.backends) {
    text += fmt::format("\n  {}: {}", name, endOf(fate));
    if (fate.standing) text += "\n    " + standingOf(*fate.standing);
    for (const support::ToldStep& step : fate.road) text += "\n    " + textOfStep(step, {});
    if (!fate.removed.empty()) text += "\n    left without " + listed(fate.removed);
    if (!fate.hashed.empty()) text += "\n    left with hashed " + listed(fate.hashed);
  }
  return text;
}

}  // namespace veltrad::ctl
