// What the daemon exports to each connection. The connection's own thread calls it, one call at a time, in
// order.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "base/value.h"
#include "wire/error.h"

namespace veltrad::wire {

// Called at most once, from any thread. When the last copy goes without a call, the client's call ends with
// the error "The daemon gave no reply.". Empty where the client wants no reply.
template <typename... Results>
using Reply = std::function<void(Results...)>;

using StringReply = Reply<std::optional<std::string>>;
using NamesReply = Reply<std::optional<std::vector<std::string>>>;
using FlushReply = Reply<std::optional<std::string>, std::optional<ReportingError>>;
using BooleanReply = Reply<bool>;
using UploadLogDataReply = Reply<bool, std::optional<ReportingError>>;

using OptionalDictionary = std::optional<Dictionary>;

class ClientSessionInterface {
 public:
  virtual ~ClientSessionInterface() = default;

  // False: the daemon may not keep so much for the client's user; nothing has changed.
  virtual bool setSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                              std::optional<Array> frameworksToCheck, bool hasAggregationBlock) = 0;
  virtual void startConfigWithCompletionHandler(NamesReply completionHandler) = 0;
  virtual void fetchStatesWithUserInfo(OptionalDictionary userInfo, NamesReply completionHandler) = 0;
  virtual void fetchDisplayURL(StringReply reply) = 0;
  virtual void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, OptionalDictionary payload,
                                       StringReply reply) = 0;
  virtual void sendMessageWithDictionary(Dictionary message, StringReply reply) = 0;
  virtual void flushMessagesWithCompletion(FlushReply completion) = 0;
  virtual void finishSessionWithReply(StringReply reply) = 0;
  // `path` is the path of the client's file address. `extensionToken` names what the client lent; empty:
  // nothing.
  virtual void uploadFileAtPath(std::string path, std::string extensionToken,
                                BooleanReply completionHandler) = 0;
  virtual void uploadLogData(Array logData, UploadLogDataReply completionHandler) = 0;
  virtual void sendMessageWithSessionInfo(OptionalDictionary sessionInfo, OptionalDictionary userInfo,
                                          std::uint16_t category, std::uint16_t type,
                                          OptionalDictionary payload, StringReply reply) = 0;

  // After the connection was invalidated and its handler has run, on the connection's own thread; once, the
  // last call of all.
  virtual void end() = 0;
  // For log lines; stable and unique among live objects.
  virtual std::string description() const = 0;
};

}  // namespace veltrad::wire
