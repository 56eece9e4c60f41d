// SPDX-License-Identifier: Apache-2.0
// Sends one-shot messages.
#include "session/one_shot.h"

#include "platform/clock.h"
#include "platform/log.h"
#include "support/device_identity.h"
#include "wire/constants.h"

namespace veltrad::session {

void sendMessageWithSessionInfo(const BackendMaking& making, support::MessageLog& messageLog,
                                OneShotMessage oneShot) {
  const Dictionary* info = oneShot.facts.sessionInfo.get();
  const Value* given = info ? info->find(wire::kVeltraSessionInfoSessionID) : nullptr;
  const std::int64_t number = given ? given->toInt64().value_or(0) : 0;
  logDebug("sendMessageWithSessionInfo: Sending single message with sessionID %ld", long{number});
  if (!info || !oneShot.storebag) {
    logError("RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters");
    return;
  }
  char deviceID[41] = {};
  making.device.copyUniqueDeviceID(deviceID, sizeof deviceID);
  backends::SessionFacts facts;
  facts.device.udid = deviceID;
  facts.take(oneShot.userInfo);
  facts.connection = backends::connectionNumber(oneShot.facts.sessionIDString);
  const auto set = createBackends(making, oneShot.storebag, info, std::move(facts));
  if (!set) {
    logError("sendMessageWithSessionInfo: No backends available to send single message");
    return;
  }
  if (oneShot.userInfo.given && !info->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false)) {
    logWarning("sendMessageWithSessionInfo: user info provided without requiring it.");
  }
  Message& message = oneShot.message;
  message.time = making.clock.now();
  oneShot.fates.describe(oneShot.facts, SessionFates::From::oneShot);
  oneShot.fates.taken(message, SessionFates::From::oneShot, oneShot.edits,
                      set->empty() ? std::optional(wire::Reason::no_backends) : std::nullopt);
  for (const auto& [name, backend] : *set) backend->updateState();
  applyProhibitions(*set, making.decision);
  for (const auto& [name, backend] : *set) {
    const auto [decision, answer] =
        backend->sendMessage(message.payload, message.time, message.category, message.type, 0, message.note);
    if (oneShot.outcomes) oneShot.outcomes->push_back({name, decision});
    if (answer) messageLog.writeToLogFile("[%@ -> sendMessageWithSessionInfo] %@", name, *answer);
  }
  for (const auto& [name, backend] : *set) backend->cleanup();
}

}  // namespace veltrad::session
