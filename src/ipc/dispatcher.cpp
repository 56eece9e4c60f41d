// The table of calls. The connection's own thread.
#include "ipc/dispatcher.h"

#include <fmt/format.h>

#include "base/property_list.h"
#include "base/text.h"
#include "ipc/pending_reply.h"

namespace veltrad::ipc {

namespace {

// A message of a few hundred fields is far below these; log data is bounded by its frame alone.
constexpr PropertyListLimits kCallLimits{kFrameBodyLimit, 64, 100'000, 8u << 20};
constexpr PropertyListLimits kLargeCallLimits{kLargeFrameBodyLimit, 64, 500'000, kLargeFrameBodyLimit};

struct Call {
  ClientSessionInterface& session;
  const Dictionary& arguments;
  const std::string& extensionToken;
  std::shared_ptr<PendingReply> pending;  // null: no reply is wanted
};

// What is wrong with the arguments; absent when the operation was run.
using Refusal = std::optional<std::string>;

Refusal mustBe(const char* argument, const char* type) {
  return fmt::format("argument \"{}\" must be {}", argument, type);
}

template <typename T>
std::optional<T> copied(const T* found) {
  return found ? std::optional<T>(*found) : std::nullopt;
}

Refusal setSessionInfo(Call& call) {
  const Dictionary& arguments = call.arguments;
  call.session.setSessionInfo(
      copied(arguments.dictionary("sessionInfo")), copied(arguments.dictionary("userInfo")),
      copied(arguments.array("frameworksToCheck")), arguments.boolean("hasAggregationBlock").value_or(false));
  // Nothing comes back but the word that it was done.
  if (call.pending) call.pending->answer({});
  return std::nullopt;
}

Refusal startConfig(Call& call) {
  call.session.startConfigWithCompletionHandler(namesReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal fetchStates(Call& call) {
  call.session.fetchStatesWithUserInfo(copied(call.arguments.dictionary("userInfo")),
                                       namesReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal fetchDisplayURL(Call& call) {
  call.session.fetchDisplayURL(stringReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithCategory(Call& call) {
  const auto category = call.arguments.uint16("category");
  if (!category) return mustBe("category", "a number");
  const auto type = call.arguments.uint16("type");
  if (!type) return mustBe("type", "a number");
  call.session.sendMessageWithCategory(*category, *type, copied(call.arguments.dictionary("payload")),
                                       stringReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithDictionary(Call& call) {
  const Dictionary* message = call.arguments.dictionary("message");
  if (!message) return mustBe("message", "a dictionary");
  call.session.sendMessageWithDictionary(*message, stringReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal flushMessages(Call& call) {
  call.session.flushMessagesWithCompletion(flushReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal finishSession(Call& call) {
  call.session.finishSessionWithReply(stringReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal uploadFile(Call& call) {
  const std::string* path = call.arguments.string("path");
  if (!path) return mustBe("path", "a text");
  call.session.uploadFileAtPath(*path, call.extensionToken, uploadedReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal uploadLogData(Call& call) {
  const Array* data = call.arguments.array("data");
  if (!data) return mustBe("data", "an array");
  call.session.uploadLogData(*data, uploadLogDataReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithSessionInfo(Call& call) {
  const auto category = call.arguments.uint16("category");
  if (!category) return mustBe("category", "a number");
  const auto type = call.arguments.uint16("type");
  if (!type) return mustBe("type", "a number");
  call.session.sendMessageWithSessionInfo(
      copied(call.arguments.dictionary("sessionInfo")), copied(call.arguments.dictionary("userInfo")),
      *category, *type, copied(call.arguments.dictionary("payload")), stringReply(std::move(call.pending)));
  return std::nullopt;
}

struct Operation {
  std::string_view name;
  Refusal (*run)(Call&);
};

constexpr std::string_view kUploadLogData = "uploadLogData:completionHandler:";

// The most frequent first.
constexpr Operation kOperations[] = {
    {"sendMessageWithCategory:type:payload:reply:", sendMessageWithCategory},
    {"sendMessageWithDictionary:reply:", sendMessageWithDictionary},
    {"flushMessagesWithCompletion:", flushMessages},
    {"fetchStatesWithUserInfo:completionHandler:", fetchStates},
    {"setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:", setSessionInfo},
    {"startConfigWithCompletionHandler:", startConfig},
    {"finishSessionWithReply:", finishSession},
    {"sendMessageWithSessionInfo:userInfo:category:type:payload:reply:", sendMessageWithSessionInfo},
    {"fetchDisplayURL:", fetchDisplayURL},
    {"uploadFileAtPath:extensionToken:completionHandler:", uploadFile},
    {kUploadLogData, uploadLogData},
};

const Operation* operationNamed(std::string_view name) {
  for (const Operation& operation : kOperations) {
    if (operation.name == name) return &operation;
  }
  return nullptr;
}

// A client's own words in an answer to it: enough to recognise them.
std::string_view shortened(std::string_view text) {
  return text.substr(0, 100);
}

}  // namespace

Result<Value, std::string> decodeFrameBody(const Frame& frame) {
  const bool large = frame.header.kind == FrameKind::largeCall;
  auto parsed = parseBinaryPropertyList(frame.body, large ? kLargeCallLimits : kCallLimits);
  if (!parsed) return Failure{"the body is no readable property list: " + parsed.error().detail};
  if (!parsed.value().asDictionary()) return Failure{std::string("the body must be a dictionary")};
  return std::move(parsed.value());
}

namespace {

Refusal runCall(const Frame& frame, ClientSessionInterface& session, const std::string& extensionToken,
                const std::shared_ptr<PendingReply>& pending) {
  const FrameKind kind = frame.header.kind;
  if (kind != FrameKind::call && kind != FrameKind::largeCall) {
    return fmt::format(
        "after its hello a client sends frames of kind 2 (call) and 6 (large call), not of kind {}",
        static_cast<unsigned>(kind));
  }
  const auto decoded = decodeFrameBody(frame);
  if (!decoded) return decoded.error();
  const Dictionary& body = *decoded.value().asDictionary();
  const std::string* name = body.string("op");
  if (!name) return "\"op\" must be a text";
  const Operation* operation = operationNamed(*name);
  if (!operation) return fmt::format("unknown operation \"{}\"", shortened(*name));
  if (kind == FrameKind::largeCall && operation->name != kUploadLogData) {
    return fmt::format("a large call is for \"{}\" alone, not for \"{}\"", kUploadLogData, *name);
  }
  static const Dictionary kNone;
  const Dictionary* arguments = body.dictionary("args");
  Call call{session, arguments ? *arguments : kNone, extensionToken, pending};
  return operation->run(call);
}

}  // namespace

std::optional<std::string> dispatchCall(const Frame& frame, ClientSessionInterface& session,
                                        const std::shared_ptr<OutQueue>& out,
                                        const std::string& extensionToken) {
  std::shared_ptr<PendingReply> pending;
  if (frame.header.callID != 0) pending = std::make_shared<PendingReply>(out, frame.header.callID);
  Refusal refusal = runCall(frame, session, extensionToken, pending);
  if (refusal && pending) {
    pending->fail(makeReportingError(fmt::format("The call cannot be read: {}.", toUTF8(*refusal)), -1));
  }
  return refusal;
}

}  // namespace veltrad::ipc
