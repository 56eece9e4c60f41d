// SPDX-License-Identifier: Apache-2.0
// Makes the argument dictionaries and frames of calls.
#include "client/calls.h"

#include "base/property_list.h"
#include "base/text.h"
#include "client/session_options.h"
#include "wire/constants.h"
#include "wire/frame.h"
#include "wire/limits.h"
#include "wire/names.h"

namespace veltrad::client {

namespace event = wire::event;
namespace key = wire::key;
namespace operation = wire::operation;

namespace {

using Entries = std::vector<Dictionary::Entry>;

// The daemon's limit, less the levels of the frame's own dictionaries.
constexpr int kDeepestArgument = wire::kMostFrameDepth - 4;

// False for a value that is too large for a call, which is then not even copied.
bool fits(const veltra_value& value) {
  return value.depth <= kDeepestArgument && value.objects <= wire::kMostCallObjects;
}

// Whether a call can carry this dictionary, which may be null.
veltra_status verdictOn(const veltra_value* dictionary) {
  if (!dictionary) return VELTRA_OK;
  if (!dictionary->entries()) return VELTRA_INVALID;
  return fits(*dictionary) ? VELTRA_OK : VELTRA_TOO_LARGE;
}

Value sessionInfo(const veltra_session_options& options) {
  Dictionary info;
  if (options.has_session_id) info.set(wire::kVeltraSessionInfoSessionID, options.session_id);
  if (options.has_client_type) info.set(wire::kVeltraSessionInfoClientType, options.client_type);
  if (options.has_client_version) {
    info.set(wire::kVeltraSessionInfoClientVersion, static_cast<unsigned>(options.client_version));
  }
  info.set(wire::kVeltraSessionInfoRequireUserInfo, options.require_user_info);
  info.set(wire::kVeltraSessionInfoBatchEvent, options.batch_events);
  return info;
}

// The arguments for session info and, if there is any, user info.
Entries identity(const veltra_session_options& options) {
  Entries arguments;
  arguments.emplace_back(key::kSessionInfo, sessionInfo(options));
  if (options.user_info || options.client_name || options.service_name) {
    Dictionary userInfo = dictionaryOfNode(options.user_info);
    if (options.client_name) userInfo.set(wire::kVeltraUserInfoClientName, toUTF8(options.client_name));
    if (options.service_name) userInfo.set(wire::kVeltraUserInfoServiceName, toUTF8(options.service_name));
    arguments.emplace_back(key::kUserInfo, std::move(userInfo));
  }
  return arguments;
}

CallFrame frameOfKind(wire::FrameKind kind, const char* operation, Entries arguments,
                      std::uint8_t descriptors = 0) {
  Entries body;
  body.reserve(2);
  body.emplace_back(key::kArguments, Dictionary::fromEntries(std::move(arguments)));
  body.emplace_back(key::kOperation, operation);
  Dictionary whole = Dictionary::fromEntries(std::move(body));
  std::string frame = wire::makeFrame(kind, 0, whole, descriptors);
  if (!wire::decodeFrameHeader(frame.data()).possible()) return {VELTRA_TOO_LARGE};
  // Every object takes at least one byte, so only a long frame needs to be counted.
  if (frame.size() > wire::kMostCallObjects && objectsIn(Value(std::move(whole))) > wire::kMostCallObjects) {
    return {VELTRA_TOO_LARGE};
  }
  return {VELTRA_OK, {std::move(frame)}};
}

CallFrame counted(CallFrame made) {
  made.call.counted = true;
  return made;
}

CallFrame changing(CallFrame made, SessionChange change) {
  if (made.status == VELTRA_OK) made.call.change = std::make_unique<SessionChange>(std::move(change));
  return made;
}

// A call whose only argument is a dictionary, which is left out if it is null.
CallFrame dictionaryFrame(const char* operation, const char* argument, const veltra_value* dictionary) {
  if (const auto status = verdictOn(dictionary); status != VELTRA_OK) return {status};
  Entries arguments;
  if (dictionary) arguments.emplace_back(argument, dictionaryOfNode(dictionary));
  return callFrame(operation, std::move(arguments));
}

}  // namespace

CallFrame callFrame(const char* operation, Entries arguments) {
  return frameOfKind(wire::FrameKind::call, operation, std::move(arguments));
}

CallFrame startFrame() {
  return changing(callFrame(operation::kStartConfig), {.starts = true});
}

CallFrame finishFrame() {
  return changing(callFrame(operation::kFinishSession), {.finishes = true});
}

CallFrame messageFrame(std::uint16_t category, std::uint16_t type, const veltra_value* payload,
                       std::uint32_t flag) {
  if (auto problem = problemOfFlag(flag)) return {VELTRA_INVALID, {}, std::move(*problem)};
  if (const auto status = verdictOn(payload); status != VELTRA_OK) return {status};
  Entries message;
  message.reserve(4);
  message.emplace_back(wire::kVeltraMessageParametersCategory, static_cast<unsigned>(category));
  if (flag != 0) message.emplace_back(wire::kVeltraMessageParametersFlag, flag);
  if (payload) message.emplace_back(wire::kVeltraMessageParametersPayload, dictionaryOfNode(payload));
  message.emplace_back(wire::kVeltraMessageParametersType, static_cast<unsigned>(type));
  if (flag == 0) return counted(callFrame(operation::kSendMessage, std::move(message)));
  Entries arguments;
  arguments.emplace_back(key::kMessage, Dictionary::fromEntries(std::move(message)));
  return counted(callFrame(operation::kSendDictionary, std::move(arguments)));
}

CallFrame messageDictionaryFrame(const veltra_value* message) {
  if (!message) return {VELTRA_INVALID};
  return counted(dictionaryFrame(operation::kSendDictionary, key::kMessage, message));
}

CallFrame statesFrame(const veltra_value* userInfo) {
  SessionChange change{SessionChange::Part::userInfo};
  CallFrame made = dictionaryFrame(operation::kFetchStates, key::kUserInfo, userInfo);
  if (made.status == VELTRA_OK && userInfo) change.described.set(key::kUserInfo, dictionaryOfNode(userInfo));
  return changing(std::move(made), std::move(change));
}

CallFrame sessionInfoFrame(const veltra_session_options& options) {
  if (const auto status = verdictOn(options.user_info); status != VELTRA_OK) return {status};
  Entries arguments = identity(options);
  if (options.frameworks_to_check) {
    if (!fits(*options.frameworks_to_check)) return {VELTRA_TOO_LARGE};
    arguments.emplace_back(key::kFrameworksToCheck, valueOfNode(*options.frameworks_to_check));
  }
  arguments.emplace_back(key::kHasAggregationBlock, options.aggregated != nullptr);
  SessionChange change{SessionChange::Part::whole, Dictionary::fromEntries(arguments)};
  return changing(callFrame(operation::kSetSessionInfo, std::move(arguments)), std::move(change));
}

CallFrame oneShotFrame(const veltra_session_options& who, std::uint16_t category, std::uint16_t type,
                       const veltra_value* payload) {
  for (const veltra_value* dictionary : {who.user_info, payload}) {
    if (const auto status = verdictOn(dictionary); status != VELTRA_OK) return {status};
  }
  Entries arguments = identity(who);
  SessionChange change{SessionChange::Part::sender, Dictionary::fromEntries(arguments)};
  arguments.emplace_back(key::kCategory, static_cast<unsigned>(category));
  if (payload) arguments.emplace_back(key::kPayload, dictionaryOfNode(payload));
  arguments.emplace_back(key::kType, static_cast<unsigned>(type));
  return counted(changing(callFrame(operation::kSendOneShot, std::move(arguments)), std::move(change)));
}

CallFrame uploadFileFrame(const char* path) {
  if (!path) return {VELTRA_INVALID};
  auto file = std::make_shared<UploadedFile>(path);
  CallFrame made = frameOfKind(wire::FrameKind::call, operation::kUploadFile,
                               {{key::kPath, toUTF8(file->absolutePath())}}, file->descriptor() >= 0 ? 1 : 0);
  made.call.file = std::move(file);
  return counted(std::move(made));
}

std::optional<std::uint32_t> callToRemoveFileOf(const Dictionary& event) {
  const std::string* operation = event.string(key::kOperation);
  if (!operation || *operation != event::kRemoveUploadedFile) return std::nullopt;
  const Dictionary* arguments = event.dictionary(key::kArguments);
  return arguments ? arguments->uint32(key::kCall).value_or(0) : 0;
}

CallFrame logDataFrame(const veltra_value* data) {
  if (!data || !data->items()) return {VELTRA_INVALID};
  if (!fits(*data)) return {VELTRA_TOO_LARGE};
  return counted(
      frameOfKind(wire::FrameKind::largeCall, operation::kUploadLogData, {{key::kData, valueOfNode(*data)}}));
}

}  // namespace veltrad::client
