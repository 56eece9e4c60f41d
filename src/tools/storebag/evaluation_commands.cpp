// SPDX-License-Identifier: Apache-2.0
// The commands that evaluate storebags: explain, diff and test.
#include <fmt/format.h>

#include "formats/json.h"
#include "platform/file_store.h"
#include "storebag/commands.h"
#include "storebag/document.h"
#include "storebag/explanation.h"
#include "storebag/recording.h"
#include "storebag/storebag_diff.h"
#include "storebag/suite.h"
#include "tools/key_value.h"

namespace veltrad::storebag {
namespace {

// The one message of the options, if they give one.
Fault readMessage(const ExplainRequest& request, Given& given) {
  if (!request.category && !request.type && request.payload.empty() && !request.payloadFile)
    return std::nullopt;
  if (!request.category || !request.type) return "a message needs --category and --type";
  GivenMessage message{*request.category, *request.type, request.flag, std::nullopt};
  if (request.payloadFile) {
    if (auto fault = taken(readDictionary(*request.payloadFile), message.payload)) return fault;
  }
  if (!request.payload.empty()) {
    const auto entries = tools::parseKeyValues(request.payload);
    if (!entries) return entries.error();
    if (!message.payload) message.payload.emplace();
    message.payload->merge(entries.value());
  }
  given.messages.push_back(std::move(message));
  return std::nullopt;
}

Fault readFiles(const SimulatedSession& session, Given& given) {
  if (session.device) {
    if (auto fault = taken(readDevice(*session.device), given.device)) return fault;
  }
  return session.policy ? taken(readPolicy(*session.policy), given.policy) : std::nullopt;
}

}  // namespace

Outcome explain(const ExplainRequest& request) {
  const auto bag = readStorebag(request.file);
  if (!bag) return {false, bag.error().line()};
  Given given = request.session.given;
  if (const auto wrong = readFiles(request.session, given)) return {false, *wrong};
  if (request.session.messages) {
    if (const auto wrong = taken(readMessages(*request.session.messages), given.messages))
      return {false, *wrong};
  }
  if (const auto wrong = readMessage(request, given)) return {false, *wrong};
  const Explanation told = explain(bag.value().storebag, given);
  return {true, request.json ? formats::writeJSON(asDictionary(told)) + "\n" : textOf(told)};
}

Outcome diff(const DiffRequest& request) {
  if (request.before == "-" && request.now == "-")
    return {false, "only one of the two can be standard input"};
  const auto before = readStorebag(request.before);
  if (!before) return {false, before.error().line()};
  const auto now = readStorebag(request.now);
  if (!now) return {false, now.error().line()};
  Given given = request.session.given;
  if (const auto wrong = readFiles(request.session, given)) return {false, *wrong};
  StorebagDiff found{changesOf(before.value().storebag, now.value().storebag), std::nullopt};
  if (request.session.messages) {
    const auto recording = readRecording(*request.session.messages);
    if (!recording) return {false, recording.error()};
    found.messages =
        messageChangesOf(before.value().storebag, now.value().storebag, given, recording.value());
  }
  return {true, request.json ? formats::writeJSON(asDictionary(found)) + "\n" : textOf(found),
          found.letsMoreLeave()};
}

Outcome test(const TestRequest& request) {
  std::vector<SuiteResult> suites;
  for (const std::string& file : request.suites) {
    auto suite = runSuite(file);
    if (!suite) return {false, suite.error()};
    suites.push_back(std::move(suite).value());
  }
  if (request.junit) {
    const auto written = platform::DiskFileStore().replace(*request.junit, junitOf(suites), 0644);
    if (!written) return {false, written.error().description};
  }
  return {true, request.json ? formats::writeJSON(asDictionary(suites)) + "\n" : textOf(suites),
          failedIn(suites) > 0};
}

}  // namespace veltrad::storebag
