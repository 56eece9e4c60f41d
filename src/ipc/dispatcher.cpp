// SPDX-License-Identifier: Apache-2.0
// Decodes calls, charges their memory, and runs them by a table of operations.
#include "ipc/dispatcher.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/property_list.h"
#include "base/text.h"
#include "ipc/pending_reply.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace key = wire::key;
namespace operation = wire::operation;

namespace {

struct Call {
  wire::ClientSessionInterface& session;
  Dictionary& arguments;
  const std::string& extensionToken;
  // Null if no reply is wanted.
  std::shared_ptr<PendingReply> pending;
};

// What is wrong with the arguments; absent if the operation was run.
using Refusal = std::optional<std::string>;

Refusal mustBe(const char* argument, const char* type) {
  return fmt::format("argument \"{}\" must be {}", argument, type);
}

Refusal setSessionInfo(Call& call) {
  const bool aggregates = call.arguments.boolean(key::kHasAggregationBlock).value_or(false);
  auto sessionInfo = call.arguments.takeDictionary(key::kSessionInfo);
  auto userInfo = call.arguments.takeDictionary(key::kUserInfo);
  const bool described =
      call.session.setSessionInfo(std::move(sessionInfo), std::move(userInfo),
                                  call.arguments.takeArray(key::kFrameworksToCheck), aggregates);
  if (!described && call.pending) {
    call.pending->fail(wire::makeReportingError(
        "The session's description is more than the daemon may keep for its user; try again later.", -1));
  }
  // The reply has no results.
  if (call.pending) call.pending->answer({});
  return std::nullopt;
}

Refusal startConfig(Call& call) {
  call.session.startConfigWithCompletionHandler(namesReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal fetchStates(Call& call) {
  call.session.fetchStatesWithUserInfo(call.arguments.takeDictionary(key::kUserInfo),
                                       namesReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal fetchDisplayURL(Call& call) {
  call.session.fetchDisplayURL(stringReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithCategory(Call& call) {
  const auto category = call.arguments.uint16(key::kCategory);
  const auto type = call.arguments.uint16(key::kType);
  if (!category || !type) return mustBe(category ? key::kType : key::kCategory, "a number");
  call.session.sendMessageWithCategory(*category, *type, call.arguments.takeDictionary(key::kPayload),
                                       sentReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithDictionary(Call& call) {
  auto message = call.arguments.takeDictionary(key::kMessage);
  if (!message) return mustBe(key::kMessage, "a dictionary");
  call.session.sendMessageWithDictionary(std::move(*message), sentReply(std::move(call.pending)));
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
  const std::string* path = call.arguments.string(key::kPath);
  if (!path) return mustBe(key::kPath, "a text");
  call.session.uploadFileAtPath(*path, call.extensionToken, uploadedReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal uploadLogData(Call& call) {
  auto data = call.arguments.takeArray(key::kData);
  if (!data) return mustBe(key::kData, "an array");
  call.session.uploadLogData(std::move(*data), uploadLogDataReply(std::move(call.pending)));
  return std::nullopt;
}

Refusal sendMessageWithSessionInfo(Call& call) {
  const auto category = call.arguments.uint16(key::kCategory);
  const auto type = call.arguments.uint16(key::kType);
  if (!category || !type) return mustBe(category ? key::kType : key::kCategory, "a number");
  auto sessionInfo = call.arguments.takeDictionary(key::kSessionInfo);
  auto userInfo = call.arguments.takeDictionary(key::kUserInfo);
  call.session.sendMessageWithSessionInfo(std::move(sessionInfo), std::move(userInfo), *category, *type,
                                          call.arguments.takeDictionary(key::kPayload),
                                          sentReply(std::move(call.pending)));
  return std::nullopt;
}

struct Operation {
  std::string_view name;
  Refusal (*run)(Call&);
  // Answers of earlier calls must not wait until it has been run.
  bool mayBlock = false;
};

// The most frequent first.
constexpr Operation kOperations[] = {
    {operation::kSendMessage, sendMessageWithCategory},
    {operation::kSendDictionary, sendMessageWithDictionary},
    {operation::kFlushMessages, flushMessages},
    {operation::kFetchStates, fetchStates},
    {operation::kSetSessionInfo, setSessionInfo},
    {operation::kStartConfig, startConfig, true},
    {operation::kFinishSession, finishSession},
    {operation::kSendOneShot, sendMessageWithSessionInfo, true},
    {operation::kFetchDisplayURL, fetchDisplayURL},
    {operation::kUploadFile, uploadFile, true},
    {operation::kUploadLogData, uploadLogData, true},
};

const Operation* operationNamed(std::string_view name) {
  for (const Operation& operation : kOperations) {
    if (operation.name == name) return &operation;
  }
  return nullptr;
}

Result<Dictionary, std::string> dictionaryOf(Result<Value, PropertyListError> parsed) {
  if (!parsed) return Failure{"the body is no readable property list: " + parsed.error().detail};
  auto dictionary = std::move(parsed.value()).takeDictionary();
  if (!dictionary) return Failure{std::string("the body must be a dictionary")};
  return std::move(*dictionary);
}

// A first estimate of the memory for a call's values, which is sufficient if no objects are shared.
std::size_t expectedMemory(std::string_view body) {
  constexpr std::size_t kLeast = 2048, kBytesOfObject = 64;
  const std::uint64_t objects =
      std::min<std::uint64_t>(declaredObjects(body).value_or(0), wire::kMostCallObjects);
  return std::min(kLeast + 2 * body.size() + kBytesOfObject * objects, wire::kMostCallMemory);
}

// The bytes that a body's control characters add to the texts made from it. Each takes six bytes in JSON, of
// which there are a compact and a readable text, and copies for the reply and the log. In a small body this
// is negligible.
std::size_t escapesOf(std::string_view body) {
  constexpr std::size_t kSmallBody = 16u << 10, kMoreBytesEach = 5, kTexts = 5;
  if (body.size() <= kSmallBody) return 0;
  const auto controls =
      std::count_if(body.begin(), body.end(), [](char c) { return static_cast<unsigned char>(c) < 0x20; });
  return kTexts * kMoreBytesEach * static_cast<std::size_t>(controls);
}

// The charge for a call whose values take `memory`, including copies and texts that are made while it runs.
std::size_t chargeOf(std::size_t memory, std::string_view body) {
  return memory + memory / 2 + 2 * body.size() + escapesOf(body) + 4096;
}

bool chargeCall(CallMemory& memory, std::size_t bytes) {
  auto charge = memory.account->tryCharge(bytes, platform::MemoryUse::working);
  if (!charge) {
    memory.beforeWait();
    const auto last = std::chrono::steady_clock::now() + kLongestWaitForMemory;
    charge = memory.account->waitToCharge(
        bytes, [&] { return memory.giveUp() || std::chrono::steady_clock::now() >= last; });
  }
  if (charge) memory.charge = std::move(*charge);
  return charge.has_value();
}

std::string usedUp(CallMemory& memory) {
  memory.usedUp = true;
  memory.counters.count(wire::Reason::call_over_share);
  return fmt::format("the memory that the daemon keeps for uid {} is used up; try again later",
                     memory.account->uid());
}

Result<Dictionary, std::string> decodeCall(const wire::Frame& frame, CallMemory& memory) {
  PropertyListLimits limits{wire::kFrameBodyLimit, wire::kMostFrameDepth, wire::kMostCallObjects,
                            wire::kMostCallMemory};
  for (limits.memory = expectedMemory(frame.body);; limits.memory = wire::kMostCallMemory) {
    // Nothing is held during the wait, so that calls cannot wait for each other.
    memory.charge.release();
    if (memory.account && !chargeCall(memory, chargeOf(limits.memory, frame.body))) {
      return Failure{usedUp(memory)};
    }
    auto parsed = parseBinaryPropertyList(frame.body, limits);
    const bool more = !parsed && parsed.error().kind == PropertyListError::Kind::overMemory &&
                      limits.memory < wire::kMostCallMemory;
    if (!more) return dictionaryOf(std::move(parsed));
  }
}

// The call was charged when its header arrived; it does not wait for more memory.
Result<Dictionary, std::string> decodeLargeCall(const wire::Frame& frame, CallMemory& memory) {
  constexpr std::size_t kBytesOfObject = 64;
  const std::size_t bytes = memory.charge.bytes();
  std::size_t objects =
      std::min<std::uint64_t>(declaredObjects(frame.body).value_or(0), wire::kMostCallObjects);
  PropertyListLimits limits{wire::kLargeFrameBodyLimit, wire::kMostFrameDepth, wire::kMostCallObjects,
                            wire::kLargeFrameBodyLimit};
  for (;; objects *= 2) {
    // If objects are shared, the limit is too low, and the body is read again with a higher one.
    if (frame.refused || (memory.account && !memory.charge.resize(bytes + kBytesOfObject * objects))) {
      return Failure{usedUp(memory)};
    }
    limits.memory = frame.body.size() + 2 * kBytesOfObject * (objects + 1);
    auto parsed = parseBinaryPropertyList(frame.body, limits);
    const bool more = !parsed && parsed.error().kind == PropertyListError::Kind::overMemory &&
                      objects < 8 * wire::kMostCallObjects;
    if (!more) return dictionaryOf(std::move(parsed));
    objects = std::max<std::size_t>(objects, 64);
  }
}

// The beginning of a client's text, enough to recognise it.
std::string_view shortened(std::string_view text) {
  return text.substr(0, 100);
}

struct Decoded {
  Dictionary body;
  const std::string* name;  // in the body, which does not move with its owner
  Dictionary arguments;
};

Result<Decoded, std::string> decode(const wire::Frame& frame, CallMemory& memory) {
  const wire::FrameKind kind = frame.header.kind;
  const bool large = kind == wire::FrameKind::largeCall;
  if (kind != wire::FrameKind::call && !large) {
    return Failure{fmt::format(
        "after its hello a client sends frames of kind 2 (call) and 6 (large call), not of kind {}",
        static_cast<unsigned>(kind))};
  }
  auto decoded = large ? decodeLargeCall(frame, memory) : decodeCall(frame, memory);
  if (!decoded) return Failure{decoded.error()};
  Dictionary& body = decoded.value();
  auto arguments = body.takeDictionary(key::kArguments);
  const std::string* name = body.string(key::kOperation);
  if (!name) return Failure{std::string("\"op\" must be a text")};
  if (large && *name != operation::kUploadLogData) {
    return Failure{fmt::format("a large call is for \"{}\" alone, not for \"{}\"", operation::kUploadLogData,
                               shortened(*name))};
  }
  return Decoded{std::move(body), name, arguments ? std::move(*arguments) : Dictionary()};
}

// Runs `run` on the call that the frame holds; a call that cannot be read gets an error.
template <typename Run>
Refusal dispatch(const wire::Frame& frame, const std::shared_ptr<OutQueue>& out, CallMemory& memory,
                 Run run) {
  std::shared_ptr<PendingReply> pending;
  if (frame.header.callID != 0) pending = std::make_shared<PendingReply>(out, frame.header.callID);
  auto decoded = decode(frame, memory);
  Refusal refusal = decoded ? run(decoded.value(), pending) : Refusal(decoded.error());
  if (refusal && pending) {
    const char* what = memory.usedUp ? "The call was not run" : "The call cannot be read";
    pending->fail(wire::makeReportingError(fmt::format("{}: {}.", what, toUTF8(*refusal)), -1));
  }
  return memory.usedUp ? std::nullopt : refusal;
}

}  // namespace

Result<Dictionary, std::string> decodeFrameBody(const wire::Frame& frame) {
  return dictionaryOf(parseBinaryPropertyList(
      frame.body, {wire::kFrameBodyLimit, wire::kMostFrameDepth, wire::kMostCallObjects,
                   wire::kMostCallMemory, wire::kMostCallMemory}));
}

std::optional<std::string> dispatchCall(const wire::Frame& frame, wire::ClientSessionInterface& session,
                                        const std::shared_ptr<OutQueue>& out, CallMemory& memory,
                                        const std::string& extensionToken) {
  return dispatch(frame, out, memory,
                  [&](Decoded& call, const std::shared_ptr<PendingReply>& pending) -> Refusal {
                    const Operation* operation = operationNamed(*call.name);
                    if (!operation) return unknownOperation(*call.name);
                    if (operation->mayBlock) out->flush();
                    Call running{session, call.arguments, extensionToken, pending};
                    return operation->run(running);
                  });
}

std::optional<std::string> dispatchQuestion(const wire::Frame& frame, Observer& observer,
                                            const std::shared_ptr<OutQueue>& out, CallMemory& memory) {
  return dispatch(frame, out, memory, [&](Decoded& call, const std::shared_ptr<PendingReply>& pending) {
    return observer.ask(*call.name, std::move(call.arguments), pending);
  });
}

std::string unknownOperation(std::string_view name) {
  return fmt::format("unknown operation \"{}\"", shortened(name));
}

}  // namespace veltrad::ipc
