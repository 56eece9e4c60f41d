// What a session hands to its back ends: messages, flushes, uploads. Plain functions; the session's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "session/backend_set.h"
#include "wire/client_session_interface.h"

namespace veltrad::support {
class MessageLog;
}  // namespace veltrad::support

namespace veltrad::session {

class FlushCounters;

// A message as the back ends take it.
struct Message {
  const Dictionary* payload = nullptr;  // null: none
  platform::TimeValue time;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;
};

// To every back end, in order; the answer for the client, or none.
std::optional<std::string> offerToBackends(const BackendSet& backends, const Message& message,
                                           support::MessageLog& messageLog);

// `completion` is called once, at the first error or after the last back end has answered; at once where
// there is no back end. May be empty.
void flushBackends(const BackendSet* backends, FlushCounters& flushes, support::MessageLog& messageLog,
                   wire::FlushReply completion);

// Whether a back end uploaded it. No back ends: null.
bool uploadFile(const BackendSet* backends, const std::string& path, const std::string& extensionToken,
                support::MessageLog& messageLog);
bool uploadLogDataArray(const BackendSet* backends, const Array& logData);

}  // namespace veltrad::session
