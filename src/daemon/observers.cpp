// SPDX-License-Identifier: Apache-2.0
// The table of questions, with the right that each needs.
#include "daemon/observers.h"

#include <fmt/format.h>

#include "backends/https/post_spool.h"
#include "base/version.h"
#include "daemon/doctor.h"
#include "daemon/history_answers.h"
#include "daemon/refresh.h"
#include "daemon/spool_answers.h"
#include "daemon/status.h"
#include "daemon/veltrad_agent.h"
#include "http/http_queue.h"
#include "ipc/dispatcher.h"
#include "ipc/listener.h"
#include "ipc/pending_reply.h"
#include "platform/memory_budget.h"
#include "wire/constants.h"
#include "wire/names.h"

namespace veltrad::daemon {

namespace question = wire::question;

enum class Right { observe, control };

struct Observers::Question {
  std::string_view name;
  Right right;
  Answer (Observers::*answer)(const Dictionary& arguments);
  // Used instead if the answer depends on the caller.
  Answer (Observers::*answerTo)(const Dictionary& arguments, Desk& desk) = nullptr;
};

const Observers::Question* Observers::questionNamed(const std::string& name) {
  static constexpr Question kQuestions[] = {
      {question::kStatus, Right::observe, &Observers::status},
      {question::kSessions, Right::observe, &Observers::sessions},
      {question::kMetrics, Right::observe, &Observers::metrics},
      {question::kVersions, Right::observe, &Observers::versions},
      {question::kConfig, Right::control, &Observers::preferences},
      {question::kSetConfig, Right::control, &Observers::setPreference},
      {question::kUnsetConfig, Right::control, &Observers::unsetPreference},
      {question::kRefresh, Right::control, &Observers::refresh},
      {question::kFates, Right::observe, &Observers::fates},
      {question::kContents, Right::control, nullptr, &Observers::contents},
      {question::kPrivacy, Right::control, &Observers::privacy},
      {question::kTurnReportingOff, Right::control, &Observers::turnReportingOff},
      {question::kTurnReportingOn, Right::control, &Observers::turnReportingOn},
      {question::kResetIdentifiers, Right::control, &Observers::resetIdentifiers},
      {question::kHistory, Right::control, &Observers::history},
      {question::kHistoryBody, Right::control, &Observers::historyBody},
      {question::kPurgeHistory, Right::control, &Observers::purgeHistory},
      {question::kSpool, Right::control, &Observers::spool},
      {question::kSendSpool, Right::control, &Observers::sendSpool},
      {question::kDropFromSpool, Right::control, &Observers::dropFromSpool},
      {question::kDoctor, Right::observe, nullptr, &Observers::doctor},
  };
  for (const Question& question : kQuestions) {
    if (question.name == name) return &question;
  }
  return nullptr;
}

// Answers the questions of one connection.
class Observers::Desk final : public ipc::Observer {
 public:
  // The connection holds its desk.
  Desk(Observers& observers, ipc::Connection& connection) : _observers(observers), _connection(connection) {}

  std::optional<std::string> ask(const std::string& operation, Dictionary arguments,
                                 std::shared_ptr<ipc::PendingReply> reply) override {
    const Question* question = questionNamed(operation);
    if (!question) return ipc::unknownOperation(operation);
    Answer answer = may(question->right) ? answered(*question, arguments) : refused(question->right);
    if (!reply) return std::nullopt;
    if (answer) {
      reply->answer(std::move(answer.value()));
    } else {
      reply->fail(wire::makeReportingError(answer.error(), -1));
    }
    return std::nullopt;
  }

  ipc::Connection& connection() { return _connection; }
  // From now on contents are kept until the connection ends.
  void watchContents(platform::WatchedContents& contents) {
    if (!_watch) _watch = contents.watch();
  }

 private:
  Answer answered(const Question& question, const Dictionary& arguments) {
    return question.answerTo ? (_observers.*question.answerTo)(arguments, *this)
                             : (_observers.*question.answer)(arguments);
  }
  bool holds(const char* entitlement) {
    const auto value = _connection.valueForEntitlement(entitlement);
    return value && value->isBoolean() && *value->toBoolean();
  }
  bool may(Right right) {
    return ipc::isOwner(_connection.uid()) || holds(wire::kControlEntitlement) ||
           (right == Right::observe && holds(wire::kObserveEntitlement));
  }
  Answer refused(Right right) {
    _observers._services.counters.count(wire::Reason::observation_refused);
    return Failure{fmt::format(
        "This needs root, the daemon's own user, or the entitlement \"{}\": add a rule for uid {} to {}.",
        right == Right::control ? wire::kControlEntitlement : wire::kObserveEntitlement, _connection.uid(),
        _observers._services.root.entitlementsPath())};
  }

  Observers& _observers;
  ipc::Connection& _connection;
  std::unique_ptr<platform::WatchedContents::Watch> _watch;  // null: does not watch
};

Observers::Observers(Services& services, VeltradAgent& agent, ipc::Listener& clients, Doctor& doctor,
                     Privacy& privacy, platform::FateRing& fates, backends::PostSpool* spool, double started)
    : _services(services),
      _agent(agent),
      _clients(clients),
      _doctor(doctor),
      _privacy(privacy),
      _fates(fates),
      _spool(spool),
      _started(started),
      _preferences(services.preferences, services.device) {}

bool Observers::listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) {
  connection->setObserver(std::make_shared<Desk>(*this, *connection));
  connection->resume();
  return true;
}

double Observers::now() const {
  return platform::timevalToSeconds(_services.clock.now());
}

Observers::Answer Observers::status(const Dictionary&) {
  const DaemonFacts facts{_started,
                          now(),
                          {{"connections", _clients.connectionCount(), _clients.mostConnections()},
                           {"posts", _services.http.underWay(), http::HTTPQueue::kMostEvents},
                           {"memory", _services.memory.used(), platform::MemoryBounds().all},
                           descriptorLimit()}};
  return Dictionary{{"daemon", statusOfDaemon(facts)},
                    {"storebags", statusOfStorebags(_agent.storebags(), facts.now)},
                    {"servers", statusOfServers(_services.http.servers())},
                    {"spool", statusOfSpool(_spool)}};
}

Observers::Answer Observers::sessions(const Dictionary& arguments) {
  const Value* after = arguments.find("after");
  return statusOfSessions(_agent, *_services.gate.decision(),
                          static_cast<std::uint64_t>(after ? after->toInt64().value_or(0) : 0));
}

Observers::Answer Observers::metrics(const Dictionary&) {
  return Dictionary{{"text", metricsText()}};
}

Observers::Answer Observers::versions(const Dictionary&) {
  return Dictionary{{"veltrad", kVersion}, {"libraries", http::transportLibraries()}};
}

Observers::Answer Observers::preferences(const Dictionary&) {
  return _preferences.list();
}

Observers::Answer Observers::setPreference(const Dictionary& arguments) {
  return _preferences.set(arguments);
}

Observers::Answer Observers::unsetPreference(const Dictionary& arguments) {
  return _preferences.unset(arguments);
}

Observers::Answer Observers::refresh(const Dictionary& arguments) {
  const std::string* name = arguments.string("name");
  if (!name) return Failure{std::string("argument \"name\" must be a text")};
  return refreshStorebag(_agent.storebags(), *name);
}

Observers::Answer Observers::doctor(const Dictionary& arguments, Desk& desk) {
  std::vector<std::int32_t> types;
  const Array* asked = arguments.array("clientTypes");
  for (const Value& value : asked ? *asked : Array()) {
    const auto type = value.toInt32();
    if (!type) return Failure{std::string("argument \"clientTypes\" must hold numbers")};
    types.push_back(*type);
  }
  return _doctor.examine(desk.connection(), _agent.storebags(), types);
}

// The entries from a position on, as they are in the ring.
Observers::Answer Observers::fates(const Dictionary& arguments) {
  // They and the rest of the answer stay below a frame's bound.
  constexpr std::size_t kMost = 8192;
  const Value* from = arguments.find("from");
  const auto position = from ? from->toInt64() : std::nullopt;
  if (!position || *position < 0) return Failure{std::string("argument \"from\" must be a position")};
  const std::uint64_t messages = _fates.messages();
  platform::FateRing::Copy copy =
      _fates.copy(static_cast<std::uint64_t>(*position), kMost, arguments.boolean("patient").value_or(true));
  return Dictionary{{"layout", wire::kFateLayout}, {"entries", Data{std::move(copy.entries)}},
                    {"next", copy.next},           {"missing", copy.missing},
                    {"end", _fates.next()},        {"messages", messages},
                    {"size", _fates.size()},       {"refresh", _fates.refresh()}};
}

// The contents of messages from a position on. The first question has no position: it starts with the next
// message.
Observers::Answer Observers::contents(const Dictionary& arguments, Desk& desk) {
  platform::WatchedContents& contents = _fates.contents();
  desk.watchContents(contents);
  const Value* from = arguments.find("from");
  const std::uint64_t end = contents.next();
  if (!from) return Dictionary{{"contents", Array()}, {"next", end}, {"end", end}};
  const auto position = from->toInt64();
  if (!position || *position < 0) return Failure{std::string("argument \"from\" must be a position")};
  platform::WatchedContents::Copy copy = contents.copy(static_cast<std::uint64_t>(*position));
  Array pieces;
  for (platform::WatchedContents::Piece& piece : copy.pieces) {
    pieces.push_back(Dictionary{{"message", piece.message}, {"contents", Data{std::move(piece.contents)}}});
  }
  return Dictionary{{"contents", std::move(pieces)}, {"next", copy.next}, {"end", end}};
}

Observers::Answer Observers::history(const Dictionary& arguments) {
  return historyPage(_services.history, arguments);
}

Observers::Answer Observers::historyBody(const Dictionary& arguments) {
  return daemon::historyBody(_services.history, arguments);
}

Observers::Answer Observers::purgeHistory(const Dictionary&) {
  return daemon::purgeHistory(_services.history);
}

Observers::Answer Observers::spool(const Dictionary& arguments) {
  return spoolPage(_spool, arguments);
}

Observers::Answer Observers::sendSpool(const Dictionary&) {
  return daemon::sendSpool(_spool);
}

Observers::Answer Observers::dropFromSpool(const Dictionary& arguments) {
  return daemon::dropFromSpool(_spool, arguments);
}

Gauges Observers::gauges() {
  const auto spooled = _spool ? _spool->queue().amount() : support::SpoolIndex::Amount();
  return {_agent.sessionCount(),
          _clients.connectionCount(),
          _services.http.underWay(),
          _services.memory.used(),
          _started,
          spooled.posts,
          spooled.bytes};
}

std::string Observers::metricsText() {
  return daemon::metricsText(_services.counters, gauges(), residentBytes());
}

}  // namespace veltrad::daemon
