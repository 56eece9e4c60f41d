// SPDX-License-Identifier: Apache-2.0
// Passes a session's messages, flushes and uploads to its back ends. The session's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "session/aggregation.h"
#include "session/backend_set.h"
#include "support/message_log.h"
#include "wire/client_session_interface.h"

namespace veltrad::session {

class FlushCounters;
class VeltradSessionDelegate;

struct Message {
  std::optional<Dictionary> payload;
  platform::TimeValue time;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;
  backends::MessageNote note = {};
};

// Converts a message dictionary of a client. Missing category, type and flag are 0.
Message messageOf(Dictionary given);

// The sender of a copy.
struct CopySender {
  VeltradSessionDelegate& delegate;
  Aggregation& aggregation;
  const std::string& sessionIDString;
  const backends::SharedDictionary& sessionInfo;
  const backends::UserInfo& userInfo;
};
// Sends a copy of the message to the client that aggregates, if there is one: that of the topmost ancestor,
// else the session's own.
CopySent sendCopy(const CopySender& sender, std::int32_t hierarchy, const Message& message);

// Sends the message through every back end in order and returns the answer for the client, if there is one.
// Adds its outcomes to `outcomes`, which is null if nobody waits for them.
std::optional<std::string> offerToBackends(const BackendSet& backends, Message message,
                                           support::MessageLog& messageLog, wire::Outcomes* outcomes);

// Calls `completion`, which may be empty, once: at the first error, or when all back ends have answered.
void flushBackends(const BackendSet* backends, FlushCounters& flushes, support::MessageLog& messageLog,
                   wire::FlushReply completion);

// These return whether a back end uploaded the data. `backends` may be null.
bool uploadFile(const BackendSet* backends, const std::string& path, const std::string& extensionToken,
                const backends::MessageNote& note, support::MessageLog& messageLog);
bool uploadLogDataArray(const BackendSet* backends, const Array& logData, const backends::MessageNote& note);

}  // namespace veltrad::session
