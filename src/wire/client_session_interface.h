// SPDX-License-Identifier: Apache-2.0
// The interface of a session that the daemon exports to each connection. The connection's own thread makes
// the calls, one at a time and in order.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "base/value.h"
#include "wire/error.h"
#include "wire/fates.h"

namespace veltrad::wire {

// Called at most once, from any thread. If all copies are destroyed without a call, the client's call ends
// with the error "The daemon gave no reply.". Empty if the client wants no reply.
template <typename... Results>
using Reply = std::function<void(Results...)>;

using StringReply = Reply<std::optional<std::string>>;
// The reply to a message, with its outcome in each back end so far.
using SentReply = Reply<std::optional<std::string>, Outcomes>;
using NamesReply = Reply<std::optional<std::vector<std::string>>>;
using FlushReply = Reply<std::optional<std::string>, std::optional<ReportingError>>;
using BooleanReply = Reply<bool>;
using UploadLogDataReply = Reply<bool, std::optional<ReportingError>>;

using OptionalDictionary = std::optional<Dictionary>;

class ClientSessionInterface {
 public:
  virtual ~ClientSessionInterface() = default;

  // False if the client's user would exceed its share of memory; then nothing has changed.
  virtual bool setSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                              std::optional<Array> frameworksToCheck, bool hasAggregationBlock) = 0;
  virtual void startConfigWithCompletionHandler(NamesReply completionHandler) = 0;
  virtual void fetchStatesWithUserInfo(OptionalDictionary userInfo, NamesReply completionHandler) = 0;
  virtual void fetchDisplayURL(StringReply reply) = 0;
  virtual void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, OptionalDictionary payload,
                                       SentReply reply) = 0;
  virtual void sendMessageWithDictionary(Dictionary message, SentReply reply) = 0;
  virtual void flushMessagesWithCompletion(FlushReply completion) = 0;
  virtual void finishSessionWithReply(StringReply reply) = 0;
  // `extensionToken` names the file that the client lent; empty if it lent none.
  virtual void uploadFileAtPath(std::string path, std::string extensionToken,
                                BooleanReply completionHandler) = 0;
  virtual void uploadLogData(Array logData, UploadLogDataReply completionHandler) = 0;
  virtual void sendMessageWithSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                                          std::uint16_t category, std::uint16_t type,
                                          OptionalDictionary payload, SentReply reply) = 0;

  // Not a client's call: runs between two calls after the connection was nudged.
  virtual void takeNews() {}
  // The last call, made once, after the connection's invalidation handler has run.
  virtual void end() = 0;
  // For log lines; constant, and unique among live objects.
  virtual std::string description() const = 0;
};

}  // namespace veltrad::wire
