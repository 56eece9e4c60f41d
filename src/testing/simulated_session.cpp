// SPDX-License-Identifier: Apache-2.0
// The operations of the wire protocol, as far as tests can observe them.
#include "testing/simulated_session.h"

#include <algorithm>
#include <iterator>

#include "ipc/dispatcher.h"
#include "ipc/pending_reply.h"
#include "wire/constants.h"
#include "wire/names.h"

namespace veltrad::testing {

namespace key = wire::key;
namespace operation = wire::operation;

namespace {

constexpr const char* kBackend = "testing";

// Operations that only need an answer without results.
constexpr std::string_view kPlain[] = {operation::kSetSessionInfo, operation::kFetchDisplayURL,
                                       operation::kFlushMessages, operation::kFinishSession};

Dictionary resultsOf(std::string_view op) {
  if (op == operation::kStartConfig || op == operation::kFetchStates)
    return {{key::kBackends, Array{kBackend}}};
  if (op == operation::kUploadFile || op == operation::kUploadLogData) return {{key::kUploaded, true}};
  return {};
}

Dictionary resultsOfMessage() {
  constexpr wire::Decision kDecision{wire::Fate::delivered, wire::Reason::reports};
  const Dictionary outcome{{key::kBackend, kBackend},
                           {key::kOutcome, wire::nameOf(kDecision.fate)},
                           {key::kReason, wire::entryOf(kDecision.reason).name},
                           {key::kText, wire::causeOf(kDecision.reason)}};
  return {{key::kOutcomes, Array{outcome}}};
}

}  // namespace

std::optional<std::string> SimulatedSession::ask(const std::string& op, Dictionary arguments,
                                                 std::shared_ptr<ipc::PendingReply> reply) {
  const auto refusal = _script.refusal();
  Dictionary results = resultsOf(op);
  if (!refusal) {
    if (op == operation::kSetSessionInfo || op == operation::kSendOneShot) describe(arguments);
    if (op == operation::kSendMessage || op == operation::kSendOneShot || op == operation::kSendDictionary) {
      const Dictionary* message =
          op == operation::kSendDictionary ? arguments.dictionary(key::kMessage) : &arguments;
      if (!message) return "argument \"message\" must be a dictionary";
      if (auto problem = send(*message)) return problem;
      results = resultsOfMessage();
    } else if (results.empty() && std::find(std::begin(kPlain), std::end(kPlain), op) == std::end(kPlain)) {
      return ipc::unknownOperation(op);
    }
  }
  if (!reply) return std::nullopt;
  _answers.give([reply = std::move(reply), refusal, results = std::move(results)]() mutable {
    if (refusal) {
      reply->fail(wire::makeReportingError(*refusal, -1));
    } else {
      reply->answer(std::move(results));
    }
  });
  return std::nullopt;
}

void SimulatedSession::describe(const Dictionary& arguments) {
  _sender = {};
  for (const char* part : {key::kSessionInfo, key::kUserInfo}) {
    if (const Dictionary* given = arguments.dictionary(part)) _sender.set(part, *given);
  }
}

// Takes the message, or returns what is wrong with it.
std::optional<std::string> SimulatedSession::send(const Dictionary& message) {
  Dictionary taken = _sender;
  for (const char* number : {key::kCategory, key::kType}) {
    const auto given = message.uint16(number);
    if (!given) return "argument \"" + std::string(number) + "\" must be a number";
    taken.set(number, unsigned{*given});
  }
  taken.set(wire::kVeltraMessageParametersFlag,
            message.uint32(wire::kVeltraMessageParametersFlag).value_or(0));
  if (const Dictionary* payload = message.dictionary(key::kPayload)) taken.set(key::kPayload, *payload);
  _script.take(taken);
  return std::nullopt;
}

}  // namespace veltrad::testing
