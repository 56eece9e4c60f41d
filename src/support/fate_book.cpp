// SPDX-License-Identifier: Apache-2.0
// Follows each message from step to step.
#include "support/fate_book.h"

#include <utility>

namespace veltrad::support {

namespace {
using wire::Fate;
using wire::Step;

// The fate that a step means by itself.
std::optional<Fate> fateAfter(const wire::StepEntry& entry) {
  const bool dashboard = entry.backend == wire::numberOfBackend(wire::kVeltraBackendDashboard);
  switch (entry.step) {
    case Step::none:
      return Fate::none;
    case Step::batched:
      return Fate::batched;
    case Step::held:
      return dashboard ? Fate::waiting : Fate::held;
    case Step::posted:
    case Step::answered:
      return Fate::posted;
    case Step::sent:
      return entry.status == 1 ? Fate::waiting : Fate::sent;
    case Step::acknowledged:
      return Fate::acknowledged;
    case Step::given_up:
      return Fate::given_up;
    case Step::written:
      return Fate::written;
    case Step::delivered:
      return Fate::delivered;
    case Step::dropped:
      return Fate::dropped;
    case Step::lost:
      return Fate::lost;
    case Step::kept:
      return Fate::kept;
    default:
      return std::nullopt;
  }
}

// Whether a reason means no more than success.
bool saysNothing(std::optional<wire::Reason> reason) {
  using wire::Reason;
  return reason == Reason::event_posted || reason == Reason::datagram_sent ||
         reason == Reason::datagram_sent_again || reason == Reason::datagram_acknowledged ||
         reason == Reason::file_uploaded || reason == Reason::log_data_uploaded || reason == Reason::always;
}

void takeNames(BackendFate& fate, const ToldStep& step) {
  for (const std::string& name : step.names) {
    fate.removed.erase(name);
    fate.hashed.erase(name);
    if (step.entry.step == Step::removed) fate.removed.insert(name);
    if (step.entry.step == Step::hashed) fate.hashed.insert(name);
  }
}

void takeStep(BackendFate& fate, const ToldStep& step) {
  const wire::StepEntry& entry = step.entry;
  takeNames(fate, step);
  if (step.standing) {
    fate.standing = step.standing;
    if ((step.message & wire::kNoMessage) == 0) fate.eventNumber = entry.eventNumber;
  }
  if (entry.batch != 0) fate.batch = entry.batch;
  if (entry.post != 0) fate.post = entry.post;
  if (entry.step == Step::kept) {
    fate.keptFor = step.text.value_or("");
    fate.nextTry = entry.time + std::int64_t{entry.bytes} * 1'000'000;
  } else {
    if (step.text) fate.url = step.text;
    if (entry.bytes != 0) fate.bytes = entry.bytes;
  }
  if (entry.events != 0) fate.events = entry.events;
  if (entry.step == Step::sent || entry.step == Step::again) ++fate.transmissions;
  if (entry.step == Step::answered) fate.status = entry.status;
  if (const auto now = fateAfter(entry)) {
    fate.fate = *now;
    const auto reason = wire::reasonIn(entry.reason);
    fate.reason = saysNothing(reason) ? std::nullopt : reason;
    if (now == Fate::held && fate.standing) fate.reason = static_cast<wire::Reason>(fate.standing->reason);
  }
  if (entry.step != Step::none && entry.step != Step::restored) fate.road.push_back(step);
}
}  // namespace

void FateBook::taken(const ToldMessage& message) {
  MessageFates fates{message, {}, {}};
  ToldStep step;
  step.message = message.entry.message;
  step.entry.step = Step::taken;
  step.entry.time = message.entry.time;
  fates.road.push_back(std::move(step));
  for (const auto& [name, reason] :
       message.session ? message.session->notMade : decltype(ToldSession::notMade)()) {
    BackendFate& fate = fates.backends[name];
    fate.fate = Fate::dropped;
    fate.reason = reason;
  }
  _messages.insert_or_assign(message.entry.message, std::move(fates));
}

void FateBook::stepped(const ToldStep& step) {
  const auto found = _messages.find(step.message);
  if (found == _messages.end()) return;
  MessageFates& fates = found->second;
  if (step.entry.backend == 0) {
    fates.road.push_back(step);
    return;
  }
  const auto [place, isNew] =
      fates.backends.try_emplace(std::string(wire::kBackendNames[step.entry.backend]));
  BackendFate& fate = place->second;
  if (isNew) {
    for (const ToldStep& before : fates.road) {
      const auto& names = before.names;
      if (before.entry.step == Step::removed) fate.removed.insert(names.begin(), names.end());
      if (before.entry.step == Step::hashed) fate.hashed.insert(names.begin(), names.end());
    }
  }
  takeStep(fate, step);
}

}  // namespace veltrad::support
