// SPDX-License-Identifier: Apache-2.0
// Sends a single message without a started session, through back ends made for the call.
#pragma once

#include <cstdint>

#include "session/backend_set.h"
#include "session/routing.h"
#include "session/session_delegate.h"
#include "session/session_fates.h"
#include "support/message_log.h"

namespace veltrad::session {

struct OneShotMessage {
  // The facts of the session that received the message, with the message's session info.
  FamilyFacts facts;
  SessionFates& fates;
  backends::UserInfo userInfo;
  const config::StorebagSection* storebag = nullptr;
  Message message;
  // The fields of the payload that the owner withholds.
  const config::EditedFields* edits = nullptr;
  // Receives the outcomes of the message; null if nobody waits for them.
  wire::Outcomes* outcomes = nullptr;
};

// Makes the back ends that the storebag names, updates their states, sends the message with flag 0 through
// each, logs their answers and cleans them up. Work that is still under way does not need the message.
void sendMessageWithSessionInfo(const BackendMaking& making, support::MessageLog& messageLog,
                                OneShotMessage oneShot);

}  // namespace veltrad::session
