// SPDX-License-Identifier: Apache-2.0
// Sends a single message without a started session, through back ends made for the call.
#pragma once

#include <cstdint>

#include "session/backend_set.h"
#include "support/message_log.h"

namespace veltrad::session {

// Pointers may be null.
struct OneShotMessage {
  const Dictionary* sessionInfo = nullptr;
  backends::UserInfo userInfo;
  const config::StorebagSection* storebag = nullptr;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  const Dictionary* payload = nullptr;
  backends::MessageNote note = {};
  // Gets what became of the message, unless it is null because nobody waits for it.
  wire::Outcomes* outcomes = nullptr;
};

// Makes the back ends that the storebag names, updates their states, sends the message with flag 0 through
// each, logs their answers and cleans them up. Work that is still under way does not need the message.
void sendMessageWithSessionInfo(const BackendMaking& making, support::MessageLog& messageLog,
                                const OneShotMessage& message);

}  // namespace veltrad::session
