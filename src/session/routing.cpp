// SPDX-License-Identifier: Apache-2.0
// Calls every back end of a session in order.
#include "session/routing.h"

#include "base/text.h"
#include "platform/log.h"
#include "session/flush_counters.h"
#include "session/session_delegate.h"
#include "wire/constants.h"

namespace veltrad::session {

Message messageOf(Dictionary given) {
  const std::uint16_t category = given.uint16(wire::kVeltraMessageParametersCategory).value_or(0);
  const std::uint16_t type = given.uint16(wire::kVeltraMessageParametersType).value_or(0);
  const std::int32_t flag = given.int32(wire::kVeltraMessageParametersFlag).value_or(0);
  return {given.takeDictionary(wire::kVeltraMessageParametersPayload), {}, category, type, flag};
}

CopySent sendCopy(const CopySender& sender, std::int32_t hierarchy, const Message& message) {
  const FamilyPlace place{sender.aggregation, sender.userInfo.given, hierarchy};
  // A root has no ancestors, so it does not need the families' lock.
  const bool toAncestor = hierarchy > 0 && sender.delegate.ancestorAggregates(place);
  if (!toAncestor && !sender.aggregation.active()) return {};
  const std::string copy =
      aggregatedCopy(sender.sessionInfo, sender.userInfo.sent, platform::timevalToSeconds(message.time),
                     message.category, message.type, message.payload ? &*message.payload : nullptr);
  CopySent sent;
  if (toAncestor) sent = sender.delegate.sendToAncestor(place, copy);
  if (!sent.taken) sent = sender.aggregation.sendToAggregator(copy, sender.sessionIDString);
  return sent;
}

std::optional<std::string> offerToBackends(const BackendSet& backends, Message message,
                                           support::MessageLog& messageLog, wire::Outcomes* outcomes) {
  std::optional<std::string> result;
  if (outcomes) outcomes->reserve(backends.size());
  for (auto next = backends.begin(); next != backends.end();) {
    const auto& [name, backend] = *next++;
    // The last one owns the payload alone, so that it need not copy what it changes.
    auto payload = next == backends.end() ? std::move(message.payload) : message.payload;
    auto [decision, answer] = backend->sendMessage(std::move(payload), message.time, message.category,
                                                   message.type, message.flag, message.note);
    if (outcomes) outcomes->push_back({name, decision});
    if (!answer) continue;
    messageLog.writeToLogFile("[%@ -> sendMessageWithDictionary] %@", name, *answer);
    const bool replaces = backend->name() == wire::kVeltraBackendHTTPPost;
    const bool standsIn = backend->name() == wire::kVeltraBackendDashboard && !result;
    if (replaces || standsIn) result = std::move(answer);
  }
  return result;
}

void flushBackends(const BackendSet* backends, FlushCounters& flushes, support::MessageLog& messageLog,
                   wire::FlushReply completion) {
  if (!backends) {
    const char* text = "No backends available to send message";
    logDebug("internalFlushMessagesWithCompletion: %s", text);
    if (completion) completion(std::nullopt, wire::makeReportingError(text, -1));
    return;
  }
  if (backends->empty()) {
    if (completion) completion(std::nullopt, std::nullopt);
    return;
  }
  const auto flush = flushes.begin(backends->size(), std::move(completion));
  for (const auto& [name, backend] : *backends) {
    // Must not refer to the session or the back end: it may run on the HTTP thread after both have gone.
    backend->flushMessagesWithCompletion(
        [&flushes, &messageLog, flush, key = name, own = backend->name()](
            const std::optional<std::string>& answer, const std::optional<wire::ReportingError>& error) {
          logDebug("internalFlushMessagesWithCompletion: %s", own.c_str());
          if (answer) messageLog.writeToLogFile("[%@ -> flushMessages] %@", key, *answer);
          flushes.finished(*flush, answer, error);
        });
  }
}

bool uploadFile(const BackendSet* backends, const std::string& path, const std::string& extensionToken,
                const backends::MessageNote& note, support::MessageLog& messageLog) {
  bool uploaded = false;
  if (backends) {
    for (const auto& [name, backend] : *backends)
      uploaded |= backend->uploadFileAtPath(path, extensionToken, note);
  }
  if (uploaded) {
    logDebug("uploadFileWithURL: File upload successful for %s", path.c_str());
  } else {
    logError("uploadFileWithURL: File upload failed for %s", path.c_str());
  }
  messageLog.writeToLogFile("[uploadFileWithURL] Upload %@ for file %@", uploaded ? "succeeded" : "failed",
                            "file://" + percentEncoded(path, "/!$&'()*+,;=:@"));
  return uploaded;
}

bool uploadLogDataArray(const BackendSet* backends, const Array& logData, const backends::MessageNote& note) {
  bool uploaded = false;
  if (backends) {
    for (const auto& [name, backend] : *backends) uploaded |= backend->uploadLogData(logData, note);
  }
  if (uploaded) {
    logDebug("uploadLogData: Log data array upload successful");
  } else {
    logError("uploadLogData: Log data array upload failed");
  }
  return uploaded;
}

}  // namespace veltrad::session
