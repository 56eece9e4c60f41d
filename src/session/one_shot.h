// A single message without a started session, through back ends that live for the call. The caller's thread.
#pragma once

#include <cstdint>
#include <string>

#include "session/backend_set.h"

namespace veltrad::support {
class MessageLog;
}  // namespace veltrad::support

namespace veltrad::session {

struct OneShotMessage {
  const Dictionary* sessionInfo = nullptr;
  backends::SharedDictionary userInfo;  // null: none
  const config::StorebagSection* storebag = nullptr;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  const Dictionary* payload = nullptr;  // null: none
};

// Makes the back ends that the storebag names, lets each compute its state, hands each the message with flag
// 0, logs what they answer, cleans them up. What they still have under way holds its own copies.
void sendMessageWithSessionInfo(const BackendMaking& making, support::MessageLog& messageLog,
                                const OneShotMessage& message);

}  // namespace veltrad::session
