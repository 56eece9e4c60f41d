// SPDX-License-Identifier: Apache-2.0
// The commands that play a storebag: explain and test.
#include <fmt/format.h>

#include "formats/json.h"
#include "platform/file_store.h"
#include "storebag/commands.h"
#include "storebag/document.h"
#include "storebag/explanation.h"
#include "storebag/suite.h"
#include "tools/key_value.h"

namespace veltrad::storebag {
namespace {

std::optional<std::string> readDraws(const std::vector<std::string>& texts, Given& given) {
  for (const std::string& text : texts) {
    const std::size_t equals = text.find('=');
    const bool named = equals != std::string::npos;
    const auto number = formats::parseJSON(named ? text.substr(equals + 1) : text);
    if (!number || !number.value().isNumber())
      return fmt::format("--draw {}: expected a number from 0 to 1, or NAME=NUMBER", text);
    if (named)
      given.draws[text.substr(0, equals)] = *number.value().toDouble();
    else
      given.draw = *number.value().toDouble();
  }
  return std::nullopt;
}

// The one message of the options, if they give one.
std::optional<std::string> readMessage(const ExplainRequest& request, Given& given) {
  if (!request.category && !request.type && request.payload.empty() && !request.payloadFile)
    return std::nullopt;
  if (!request.category || !request.type) return "a message needs --category and --type";
  GivenMessage message{*request.category, *request.type, request.flag, std::nullopt};
  if (request.payloadFile) {
    auto payload = readDictionary(*request.payloadFile);
    if (!payload) return payload.error();
    message.payload = std::move(payload).value();
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

std::optional<std::string> readFiles(const ExplainRequest& request, Given& given) {
  if (request.device) {
    auto device = readDictionary(*request.device);
    if (!device) return device.error();
    given.device = std::move(device).value();
  }
  if (request.policy) {
    auto policy = readDictionary(*request.policy);
    if (!policy) return policy.error();
    given.policy = std::move(policy).value();
  }
  if (!request.messages) return std::nullopt;
  const auto lines = readBytes(*request.messages);
  if (!lines) return lines.error();
  auto messages = messagesIn(lines.value());
  if (!messages) return *request.messages + ":" + messages.error();
  given.messages = std::move(messages).value();
  return std::nullopt;
}

std::optional<std::string> readUserInfo(const std::vector<std::string>& texts, Given& given) {
  const auto entries = tools::parseKeyValues(texts);
  if (!entries) return "--user-info " + entries.error();
  for (const auto& [key, value] : entries.value()) given.setUserInfo(key, value);
  return std::nullopt;
}

std::optional<std::string> complete(const ExplainRequest& request, Given& given) {
  if (auto wrong = readUserInfo(request.userInfo, given)) return wrong;
  if (auto wrong = readDraws(request.draws, given)) return wrong;
  if (auto wrong = readFiles(request, given)) return wrong;
  return readMessage(request, given);
}

}  // namespace

Outcome explain(const ExplainRequest& request) {
  const auto bag = readStorebag(request.file);
  if (!bag) return {false, bag.error().line()};
  Given given = request.given;
  if (const auto wrong = complete(request, given)) return {false, *wrong};
  const Explanation told = explain(bag.value().storebag, given);
  return {true, request.json ? formats::writeJSON(asDictionary(told)) + "\n" : textOf(told)};
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
