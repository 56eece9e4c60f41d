// A session's messages: routing to the aggregating client and the backends, flushes, uploads.
#include "backends/backend.h"
#include "base/text.h"
#include "ipc/connection.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "session/flush_counters.h"
#include "session/one_shot.h"
#include "session/session_delegate.h"
#include "session/veltrad_session.h"
#include "support/message_log.h"
#include "wire/constants.h"

namespace veltrad::session {

void VeltradSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                             wire::OptionalDictionary payload, wire::StringReply reply) {
  logDebug("sendMessageWithCategory: Sending message for session %u", sessionID());
  const auto answer = sendMessageWithCategory(category, type, std::move(payload));
  if (reply) reply(answer);
}

void VeltradSession::sendMessageWithDictionary(Dictionary message, wire::StringReply reply) {
  logDebug("sendMessageWithCategory: Sending message for session %u", sessionID());
  const auto answer = sendMessageWithDictionary(message, Origin::client);
  if (reply) reply(answer);
}

void VeltradSession::finishSessionWithReply(wire::StringReply reply) {
  logDebug("finishSessionWithReply: Finishing session %u", sessionID());
  const auto answer = sendMessageWithCategory(0, 2, std::nullopt);
  if (reply) reply(answer);
}

std::optional<std::string> VeltradSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                                   wire::OptionalDictionary payload,
                                                                   Origin origin) {
  Dictionary message{{wire::kVeltraMessageParametersCategory, unsigned{category}},
                     {wire::kVeltraMessageParametersFlag, 0u},
                     {wire::kVeltraMessageParametersType, unsigned{type}}};
  if (payload) message.set(wire::kVeltraMessageParametersPayload, std::move(*payload));
  return sendMessageWithDictionary(message, origin);
}

std::optional<std::string> VeltradSession::sendMessageWithDictionary(const Dictionary& message,
                                                                     Origin origin) {
  const auto set = backends();
  if (!set) {
    logDebug("sendMessageWithDictionary: No backends available to send message");
    if (origin == Origin::client) {
      _services.counters.count(wire::Reason::no_backends);
    }
    return std::nullopt;
  }
  const auto category = message.uint32(wire::kVeltraMessageParametersCategory);
  if (!category) {
    logDebug("sendMessageWithDictionary: Missing mandatory parameter 'category'");
    _services.counters.count(wire::Reason::no_category);
    return std::nullopt;
  }
  const auto type = message.uint32(wire::kVeltraMessageParametersType);
  if (!type) {
    logDebug("sendMessageWithDictionary: Missing mandatory parameter 'type'");
    _services.counters.count(wire::Reason::no_type);
    return std::nullopt;
  }
  const auto category16 = static_cast<std::uint16_t>(*category);
  const auto type16 = static_cast<std::uint16_t>(*type);
  const Dictionary* payload = message.dictionary(wire::kVeltraMessageParametersPayload);
  const auto flag = static_cast<std::int32_t>(message.uint32(wire::kVeltraMessageParametersFlag).value_or(0));
  const platform::TimeValue time = _services.clock.now();
  _services.counters.count(wire::Reason::message_taken_in);
  sayWithoutUserInfo();
  if (hasAggregator() || getSessionHierarchy() > 0) {
    aggregateMessage(sessionInfo(), platform::timevalToSeconds(time), category16, type16, payload);
  }
  return offerToBackends(*set, payload, time, category16, type16, flag);
}

std::optional<std::string> VeltradSession::offerToBackends(const BackendSet& set, const Dictionary* payload,
                                                           platform::TimeValue time, std::uint16_t category,
                                                           std::uint16_t type, std::int32_t flag) {
  std::optional<std::string> result;
  for (const auto& [name, backend] : set) {
    auto answer = backend->sendMessage(payload, time, category, type, flag);
    if (!answer) continue;
    _services.messageLog.writeToLogFile("[%@ -> sendMessageWithDictionary] %@", name, *answer);
    const bool replaces = backend->name() == wire::kVeltraBackendHTTPPost;
    const bool standsIn = backend->name() == wire::kVeltraBackendDashboard && !result;
    if (replaces || standsIn) result = std::move(answer);
  }
  return result;
}

void VeltradSession::internalSendMessage(const Dictionary& payload, std::uint16_t method,
                                         std::uint16_t respCode) {
  sendMessageWithCategory(method, respCode, wire::OptionalDictionary(payload), Origin::session);
  logDebug("internalSendMessage: Sent internal message (method:%d respCode:%d)", method, respCode);
}

// Once, not for each message; a root says it too, though nobody looks for its ancestors.
void VeltradSession::sayWithoutUserInfo() {
  if (_saidWithoutUserInfo) return;
  _saidWithoutUserInfo = true;
  if (userInfo()) return;
  logInfo("getAncestorWithAggregatorForSession: No user info found for session %u", sessionID());
}

void VeltradSession::aggregateMessage(const backends::SharedDictionary& info, double timestamp,
                                      std::uint16_t category, std::uint16_t type, const Dictionary* payload) {
  const auto merged = [&]() -> wire::OptionalDictionary {
    if (!payload) return std::nullopt;
    Dictionary all = *payload;
    if (const backends::SharedDictionary mine = userInfo()) all.merge(*mine);
    return all;
  };
  std::optional<std::string> line;
  // A root has no ancestors, so it needs no look at them and no lock of the registry's.
  const bool toAncestor = getSessionHierarchy() > 0 &&
                          _sessionDelegate.withAncestorAggregator(*this, [&](VeltradSession& ancestor) {
                            line = ancestor.sendToAggregator(info, timestamp, category, type, merged());
                          });
  if (!toAncestor && hasAggregator()) {
    line = sendToAggregator(info, timestamp, category, type, merged());
  }
  if (line) logError("%s", line->c_str());
}

std::optional<std::string> VeltradSession::sendToAggregator(const backends::SharedDictionary& info,
                                                            double timestamp, std::uint16_t category,
                                                            std::uint16_t type,
                                                            wire::OptionalDictionary payload) {
  std::shared_ptr<ipc::Connection> connection;
  {
    const Lock held(_mutex);
    connection = _connection;
  }
  std::optional<std::string> failure;
  if (connection) {
    const auto proxy = connection->remoteObjectProxyWithErrorHandler(
        [&failure](const std::string& description) { failure = description; });
    proxy->sendMessageToClient(info ? wire::OptionalDictionary(*info) : std::nullopt, timestamp, category,
                               type, std::move(payload));
  } else {
    failure = "The session has ended.";
    _services.counters.count(wire::Reason::client_gone);
  }
  if (!failure) return std::nullopt;
  return _dropLine.happened("sendMessageWithDictionary: Failed to get remote object proxy: " + *failure);
}

std::optional<std::string> VeltradSession::shutdownSessionAggregation() {
  logDebug("shutdownSessionAggregation: Disable aggregation module for session %u", sessionID());
  if (!_hasAggregator.exchange(false)) return std::nullopt;
  return sendToAggregator(nullptr, 0, 0, 0, std::nullopt);
}

void VeltradSession::flushMessagesWithCompletion(wire::FlushReply completion) {
  logDebug("flushMessagesWithCompletion: Flushing messages for session %u", sessionID());
  internalFlushMessagesWithCompletion(std::move(completion));
}

void VeltradSession::internalFlushMessagesWithCompletion(wire::FlushReply completion) {
  const auto set = backends();
  if (!set) {
    const char* text = "No backends available to send message";
    logDebug("internalFlushMessagesWithCompletion: %s", text);
    if (completion) completion(std::nullopt, wire::makeReportingError(text, -1));
    return;
  }
  if (set->empty()) {
    if (completion) completion(std::nullopt, std::nullopt);
    return;
  }
  FlushCounters& flushes = _services.flushes;
  support::MessageLog& messageLog = _services.messageLog;
  const auto flush = flushes.begin(set->size(), std::move(completion));
  for (const auto& [name, backend] : *set) {
    // Holds neither the session nor the backend: it may run on the HTTP thread, long after both have gone.
    backend->flushMessagesWithCompletion(
        [&flushes, &messageLog, flush, key = name, own = backend->name()](
            const std::optional<std::string>& answer, const std::optional<wire::ReportingError>& error) {
          logDebug("internalFlushMessagesWithCompletion: %s", own.c_str());
          if (answer) messageLog.writeToLogFile("[%@ -> flushMessages] %@", key, *answer);
          flushes.finished(*flush, answer, error);
        });
  }
}

void VeltradSession::uploadFileAtPath(std::string path, std::string extensionToken,
                                      wire::BooleanReply completionHandler) {
  logDebug("uploadFileAtPath: Uploading file for session %u", sessionID());
  bool uploaded = false;
  if (const auto set = backends()) {
    for (const auto& [name, backend] : *set) uploaded |= backend->uploadFileAtPath(path, extensionToken);
  }
  if (uploaded) {
    logDebug("uploadFileWithURL: File upload successful for %s", path.c_str());
  } else {
    logError("uploadFileWithURL: File upload failed for %s", path.c_str());
  }
  // The full text of the file's address.
  _services.messageLog.writeToLogFile("[uploadFileWithURL] Upload %@ for file %@",
                                      uploaded ? "succeeded" : "failed",
                                      "file://" + percentEncoded(path, "/!$&'()*+,;=:@"));
  if (completionHandler) completionHandler(uploaded);
}

void VeltradSession::uploadLogData(Array logData, wire::UploadLogDataReply completionHandler) {
  bool uploaded = false;
  if (const auto set = backends()) {
    for (const auto& [name, backend] : *set) uploaded |= backend->uploadLogData(logData);
  }
  if (uploaded) {
    logDebug("uploadLogData: Log data array upload successful");
  } else {
    logError("uploadLogData: Log data array upload failed");
  }
  if (completionHandler) completionHandler(uploaded, std::nullopt);
}

void VeltradSession::sendMessageWithSessionInfo(wire::OptionalDictionary info,
                                                wire::OptionalDictionary userInfo, std::uint16_t category,
                                                std::uint16_t type, wire::OptionalDictionary payload,
                                                wire::StringReply reply) {
  if (!info || !info->int32(wire::kVeltraSessionInfoClientType) ||
      !info->uint32(wire::kVeltraSessionInfoSessionID)) {
    logError("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    _services.counters.count(wire::Reason::no_identifiers);
    return;  // the reply is never given, which ends the client's call
  }
  _sessionID.store(info->uint32(wire::kVeltraSessionInfoSessionID).value_or(0), std::memory_order_relaxed);
  backends::SharedDictionary kept;
  backends::SharedDictionary identity;
  if (!charged(std::move(info), kept) || !charged(std::move(userInfo), identity)) {
    _services.counters.count(wire::Reason::message_over_share);
    return;
  }
  keepSessionInfo(kept);
  receivedUserInfo(identity);
  logDebug("sendMessageWithSessionInfo: Sending message with session info for session %u", sessionID());
  const auto storebag = _sessionDelegate.storebagForSession(*this);
  if (!storebag) {
    _services.counters.count(wire::Reason::no_storebag);
    if (reply) reply("storebag not available");
    return;
  }
  _services.counters.count(wire::Reason::one_shot_taken_in);
  veltrad::session::sendMessageWithSessionInfo(
      {_services.factory, _services.device, _services.library, _services.clock, _account, true},
      _services.messageLog,
      {kept.get(), identity, storebag.get(), category, type, payload ? &*payload : nullptr});
  if (reply) reply("finished");
}

}  // namespace veltrad::session
