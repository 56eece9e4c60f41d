// SPDX-License-Identifier: Apache-2.0
// Reads the lines of a recording.
#include "storebag/recording.h"

#include <fmt/format.h>

#include <algorithm>
#include <string_view>
#include <utility>

#include "base/text.h"
#include "formats/json.h"
#include "storebag/document.h"
#include "wire/constants.h"

namespace veltrad::storebag {
namespace {

// Whether a line of a recording is a message that reached the back ends, with what it held.
bool isWatched(const Dictionary& line) {
  const std::string* event = line.string("event");
  return event && *event == "message" && line.contains(wire::kVeltraMessageParametersCategory) &&
         line.contains(wire::kVeltraMessageParametersType) && !line.contains("contentsLost");
}

Dictionary sessionOf(const Dictionary& line) {
  Dictionary session;
  for (const char* key :
       {"session", "clientType", "sessionID", "clientVersion", "client", "service", "userInfo", "storebag"})
    if (const Value* value = line.find(key)) session.set(key, *value);
  return session;
}

}  // namespace

Result<std::vector<RecordedMessage>, std::string> readRecording(const std::string& file) {
  const auto bytes = readBytes(file);
  if (!bytes) return Failure{bytes.error()};
  std::string_view lines = bytes.value();
  std::vector<RecordedMessage> messages;
  for (std::size_t number = 1; !lines.empty(); ++number) {
    const std::size_t end = std::min(lines.find('\n'), lines.size());
    const std::string_view line = trimmed(lines.substr(0, end));
    lines.remove_prefix(std::min(end + 1, lines.size()));
    if (line.empty()) continue;
    const auto value = formats::parseJSON(line);
    if (!value)
      return Failure{
          fmt::format("{}:{}:{}: {}", file, number, value.error().offset + 1, value.error().detail)};
    const Dictionary* object = value.value().asDictionary();
    const bool watched = object && isWatched(*object);
    const std::string* operation = object ? object->string("op") : nullptr;
    if (!watched && !(operation && *operation == "send")) continue;
    auto message = messageOf(value.value());
    if (!message) return Failure{fmt::format("{}:{}:1: {}", file, number, message.error())};
    messages.push_back({number, std::move(message).value(), watched ? sessionOf(*object) : Dictionary()});
  }
  return messages;
}

Result<std::vector<GivenMessage>, std::string> readMessages(const std::string& file) {
  auto recording = readRecording(file);
  if (!recording) return Failure{recording.error()};
  std::vector<GivenMessage> messages;
  for (RecordedMessage& one : recording.value()) messages.push_back(std::move(one.message));
  return messages;
}

void takeSession(const Dictionary& session, Given& given) {
  given.clientType = session.int32("clientType").value_or(given.clientType);
  given.sessionID = session.uint32("sessionID").value_or(given.sessionID);
  given.clientVersion = session.uint16("clientVersion").value_or(given.clientVersion);
  if (const Dictionary* info = session.dictionary("userInfo"))
    for (const auto& [key, value] : *info) given.setUserInfo(key, value);
  for (const auto& [key, name] : {std::pair("client", wire::kVeltraUserInfoClientName),
                                  std::pair("service", wire::kVeltraUserInfoServiceName)})
    if (const std::string* text = session.string(key)) given.setUserInfo(name, *text);
  if (given.userInfo && !session.empty()) given.requireUserInfo = true;
  const Dictionary* storebag = session.dictionary("storebag");
  if (const std::string* section = storebag ? storebag->string("section") : nullptr)
    static_cast<void>(given.takeEnvironment(*section));
}

}  // namespace veltrad::storebag
