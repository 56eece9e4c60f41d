// SPDX-License-Identifier: Apache-2.0
// Configures and starts a session, sends its messages, answers its queries and ends it.
#include "session/veltrad_session.h"

#include <fmt/format.h>

#include "base/base64.h"
#include "platform/log.h"
#include "platform/uuid.h"
#include "session/kept_info.h"
#include "session/one_shot.h"
#include "session/routing.h"
#include "session/session_delegate.h"
#include "session/start_message.h"
#include "support/device_identity.h"
#include "wire/constants.h"

namespace veltrad::session {

namespace {
std::string newSessionIDString() {
  const auto uuid = platform::randomUUID();
  return encodeBase64({reinterpret_cast<const char*>(uuid.data()), uuid.size()});
}
}  // namespace

std::shared_ptr<VeltradSession> VeltradSession::initWithSessionDelegate(
    const SessionServices& services, VeltradSessionDelegate& delegate,
    std::shared_ptr<ipc::Connection> connection) {
  logDebug("initWithSessionDelegate: VeltradSession initWithSessionDelegate:%s",
           delegate.description().c_str());
  std::shared_ptr<VeltradSession> session(
      new VeltradSession(services, delegate, std::move(connection), newSessionIDString()));
  logDebug("initWithSessionDelegate: Initialized session with UUID %s", session->_sessionIDString.c_str());
  return session;
}

VeltradSession::VeltradSession(const SessionServices& services, VeltradSessionDelegate& delegate,
                               std::shared_ptr<ipc::Connection> connection, std::string sessionIDString)
    : _services(services),
      _sessionDelegate(delegate),
      _sessionIDString(std::move(sessionIDString)),
      _account(connection->memoryAccount()),
      _aggregation(std::make_shared<Aggregation>(std::move(connection))),
      _ownerFilter(services.gate),
      _fates(services.fates) {
  _services.device.copyUniqueDeviceID(_deviceid, sizeof _deviceid);
}

std::string VeltradSession::description() const {
  return fmt::format("<VeltradSession: {}>", fmt::ptr(this));
}

FamilyFacts VeltradSession::familyFacts() const {
  return {_aggregation, _sessionID,   _sessionIDString, _userInfo.given,
          _backends,    _sessionInfo, _userInfo.sent};
}

std::optional<std::int32_t> VeltradSession::clientType() const {
  return _sessionInfo ? _sessionInfo->int32(wire::kVeltraSessionInfoClientType) : std::nullopt;
}

bool VeltradSession::setSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                                    std::optional<Array>, bool hasAggregationBlock) {
  backends::SharedDictionary info;
  backends::SharedDictionary identity;
  if (!charged(std::move(sessionInfo), info) || !charged(std::move(userInfo), identity)) return false;
  _sessionID = info ? info->uint32(wire::kVeltraSessionInfoSessionID).value_or(0) : 0;
  logDebug("setSessionInfo: Configuring session %u", _sessionID);
  const bool required = info && info->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false);
  if (identity && !required) {
    logWarning("setSessionInfo: Configure session: user info provided without requiring it");
  }
  _sessionInfo = std::move(info);
  keepUserInfo(identity);
  _aggregation->setActive(hasAggregationBlock);
  _sessionDelegate.sessionInfoUpdated(familyFacts());
  return true;
}

bool VeltradSession::charged(wire::OptionalDictionary given, backends::SharedDictionary& kept) {
  if (!given) return true;
  kept = keptInfo(std::move(*given), _account);
  if (!kept) _services.counters.count(wire::Reason::info_over_share);
  return kept != nullptr;
}

void VeltradSession::keepUserInfo(const backends::SharedDictionary& info) {
  _saidWithoutUserInfo = false;
  _userInfo = _ownerFilter.allowed(info);
  _fates.forget();
}

void VeltradSession::hearOwner() {
  _ownerFilter.hear([this] {
    _fates.forget();
    _ownerFilter.takeIdentity(_services.device, _deviceid, _backends.get());
    _userInfo = _ownerFilter.allowed(_userInfo.given);
    if (!_backends) return;
    for (const auto& [name, backend] : *_backends) backend->setUserInfoDict(_userInfo);
    _leftFamily ? applyProhibitions(*_backends, _ownerFilter.now()) : updateSessionWithDefaultSessionInfo();
  });
}

void VeltradSession::startConfigWithCompletionHandler(wire::NamesReply completionHandler) {
  logDebug("startConfigWithCompletionHandler: Starting configuration for session %u", _sessionID);
  auto storebag = _sessionDelegate.storebagForSession(*this);
  hearOwner();
  if (!storebag) {
    _services.counters.count(wire::Reason::start_without_storebag);
    if (completionHandler) completionHandler(std::nullopt);
    return;
  }
  _storebag.give(std::move(storebag), _sessionDelegate.storebagVersionForSession(*this));
  createBackends(nullptr);
  updateSessionWithDefaultSessionInfo();
  hearOwner();
  internalSendMessage(
      startMessagePayload(_services.device, _services.library, _services.preferences, _services.locale), 0,
      0);
  if (completionHandler) completionHandler(fetchReportingStates());
}

void VeltradSession::takeNews() {
  hearOwner();
  auto now = _backends ? _sessionDelegate.storebagNow(*this) : std::nullopt;
  if (!now) return;
  _storebag.follow(std::move(*now), _sessionID, [this] {
    createBackends(_backends.get());
    updateSessionWithDefaultSessionInfo();
  });
}

void VeltradSession::createBackends(const BackendSet* before) {
  logDebug("createBackendsWithStorebag: Creating backends for session %u", _sessionID);
  // It may not have been available when the client connected.
  if (_deviceid[0] == '\0') _services.device.copyUniqueDeviceID(_deviceid, sizeof _deviceid);
  backends::SessionFacts facts;
  facts.device.udid = _deviceid;
  facts.take(_userInfo);
  facts.combinedSessionIDString = _sessionIDString;
  facts.connection = backends::connectionNumber(_sessionIDString);
  auto made =
      session::createBackends({_services.factory, _services.device, _services.library, _services.clock,
                               _services.counters, _ownerFilter.now(), _account, false,
                               _fates.comesFrom(_storebag.section().origin, _sessionInfo), before},
                              &_storebag.section(), _sessionInfo.get(), std::move(facts));
  _backends.swap(made);
  cleanUp(made.get());  // those that were replaced
}

void VeltradSession::updateSessionWithDefaultSessionInfo() {
  _sessionDelegate.userInfoUpdatedForSession(familyFacts());
  updateStates(_backends.get());
  _sessionDelegate.updateDownstreamSessions(familyFacts());
  // Only now, because the daemon knows the back ends and tells them every later decision.
  if (_backends) applyProhibitions(*_backends, _ownerFilter.now());
}

std::optional<std::vector<std::string>> VeltradSession::fetchReportingStates() const {
  if (!_backends) return std::nullopt;
  return reportingNames(*_backends);
}

void VeltradSession::fetchStatesWithUserInfo(wire::OptionalDictionary userInfo,
                                             wire::NamesReply completionHandler) {
  logDebug("fetchStatesWithUserInfo: Fetching states for session %u", _sessionID);
  hearOwner();
  backends::SharedDictionary identity;
  if (charged(std::move(userInfo), identity)) receivedUserInfo(identity);
  if (completionHandler) completionHandler(fetchReportingStates());
}

void VeltradSession::receivedUserInfo(const backends::SharedDictionary& updated) {
  const backends::SharedDictionary current = _userInfo.given;
  if (!updated) {
    if (!current) return;
    if (_sessionInfo && _sessionInfo->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false))
      return;
  }
  const bool unchanged = current && updated && sameClient(*current, *updated);
  keepUserInfo(updated);
  if (_backends) {
    for (const auto& [name, backend] : *_backends) backend->setUserInfoDict(_userInfo);
  }
  if (unchanged) return _sessionDelegate.sessionInfoUpdated(familyFacts());
  logDebug("receivedUserInfo: Received new user info for session %u", _sessionID);
  updateSessionWithDefaultSessionInfo();
}

void VeltradSession::fetchDisplayURL(wire::StringReply reply) {
  logDebug("fetchDisplayURL: Fetching display URL for session %u", _sessionID);
  if (reply) reply(displayURLOf(_backends.get()).value_or("URL not available"));
}

void VeltradSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                             wire::OptionalDictionary payload, wire::SentReply reply) {
  logDebug("sendMessageWithCategory: Sending message for session %u", _sessionID);
  wire::Outcomes outcomes;
  auto answer = sendMessageWithCategory(category, type, std::move(payload), reply ? &outcomes : nullptr);
  if (reply) reply(std::move(answer), std::move(outcomes));
}

void VeltradSession::sendMessageWithDictionary(Dictionary message, wire::SentReply reply) {
  logDebug("sendMessageWithCategory: Sending message for session %u", _sessionID);
  wire::Outcomes outcomes;
  auto answer = sendMessageWithDictionary(std::move(message), reply ? &outcomes : nullptr);
  if (reply) reply(std::move(answer), std::move(outcomes));
}

void VeltradSession::finishSessionWithReply(wire::StringReply reply) {
  logDebug("finishSessionWithReply: Finishing session %u", _sessionID);
  const auto answer = sendMessageWithCategory(0, 2, std::nullopt, nullptr);
  if (reply) reply(answer);
}

std::optional<std::string> VeltradSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                                   wire::OptionalDictionary payload,
                                                                   wire::Outcomes* outcomes, Origin origin) {
  Message message{std::move(payload), {}, category, type, 0};
  if (!hasBackends(message, origin)) return std::nullopt;
  return sendMessage(std::move(message), outcomes, origin);
}

std::optional<std::string> VeltradSession::sendMessageWithDictionary(Dictionary given,
                                                                     wire::Outcomes* outcomes) {
  const auto category = given.uint16(wire::kVeltraMessageParametersCategory);
  const auto type = given.uint16(wire::kVeltraMessageParametersType);
  Message message = messageOf(std::move(given));
  if (!hasBackends(message, Origin::client)) return std::nullopt;
  if (!category) {
    logDebug("sendMessageWithDictionary: Missing mandatory parameter 'category'");
    return refused(std::move(message), wire::Reason::no_category);
  }
  if (!type) {
    logDebug("sendMessageWithDictionary: Missing mandatory parameter 'type'");
    return refused(std::move(message), wire::Reason::no_type);
  }
  return sendMessage(std::move(message), outcomes, Origin::client);
}

bool VeltradSession::hasBackends(Message& message, Origin origin) {
  hearOwner();
  if (_backends) return true;
  logDebug("sendMessageWithDictionary: No backends available to send message");
  if (origin == Origin::client) static_cast<void>(refused(std::move(message), wire::Reason::no_backends));
  return false;
}

std::nullopt_t VeltradSession::refused(Message message, wire::Reason why, SessionFates* oneShot) {
  _services.counters.count(why);
  static_cast<void>(_ownerFilter.restrict(message.payload));
  (oneShot ? *oneShot : _fates)
      .refused(familyFacts(), std::move(message), oneShot ? Origin::oneShot : Origin::client,
               _sessionDelegate.reasonBehind(*this, why));
  return std::nullopt;
}

SessionFates& VeltradSession::fates() {
  if (!_fates.described()) _fates.describe(familyFacts(), Origin::client);
  return _fates;
}

// Sets the message's time. There are back ends.
std::optional<std::string> VeltradSession::sendMessage(Message message, wire::Outcomes* outcomes,
                                                       Origin origin) {
  const config::EditedFields edits = _ownerFilter.restrict(message.payload);
  message.time = _services.clock.now();
  _services.counters.count(wire::Reason::message_taken_in);
  sayWithoutUserInfo();
  CopySent copy;
  const std::int32_t hierarchy = hierarchyOf(_backends.get());
  if (hierarchy > 0 || _aggregation->active()) {
    copy = sendCopy({_sessionDelegate, *_aggregation, _sessionIDString, _sessionInfo, _userInfo}, hierarchy,
                    message);
    if (copy.line) logError("%s", copy.line->c_str());
  }
  fates().taken(message, origin, &edits,
                _backends->empty() ? std::optional(wire::Reason::no_backends) : std::nullopt, copy.to);
  return offerToBackends(*_backends, std::move(message), _services.messageLog, outcomes);
}

void VeltradSession::internalSendMessage(const Dictionary& payload, std::uint16_t method,
                                         std::uint16_t respCode) {
  sendMessageWithCategory(method, respCode, payload, nullptr, Origin::session);
  logDebug("internalSendMessage: Sent internal message (method:%d respCode:%d)", method, respCode);
}

// Logged once for each user info, also for a root, which has no ancestors.
void VeltradSession::sayWithoutUserInfo() {
  if (_saidWithoutUserInfo) return;
  _saidWithoutUserInfo = true;
  if (_userInfo.given) return;
  logInfo("getAncestorWithAggregatorForSession: No user info found for session %u", _sessionID);
}

void VeltradSession::flushMessagesWithCompletion(wire::FlushReply completion) {
  logDebug("flushMessagesWithCompletion: Flushing messages for session %u", _sessionID);
  hearOwner();
  flushBackends(_backends.get(), _services.flushes, _services.messageLog, std::move(completion));
}

void VeltradSession::uploadFileAtPath(std::string path, std::string extensionToken,
                                      wire::BooleanReply completionHandler) {
  logDebug("uploadFileAtPath: Uploading file for session %u", _sessionID);
  hearOwner();
  const bool uploaded = uploadFile(_backends.get(), path, extensionToken,
                                   fates().taken(SessionFates::Item::file), _services.messageLog);
  if (completionHandler) completionHandler(uploaded);
}

void VeltradSession::uploadLogData(Array logData, wire::UploadLogDataReply completionHandler) {
  hearOwner();
  const config::EditedFields edits = _ownerFilter.restrict(logData);
  backends::MessageNote note = fates().taken(SessionFates::Item::logData);
  note.edits = &edits;
  const bool uploaded = uploadLogDataArray(_backends.get(), logData, note);
  if (completionHandler) completionHandler(uploaded, std::nullopt);
}

void VeltradSession::sendMessageWithSessionInfo(wire::OptionalDictionary info,
                                                wire::OptionalDictionary userInfo, std::uint16_t category,
                                                std::uint16_t type, wire::OptionalDictionary payload,
                                                wire::SentReply reply) {
  SessionFates fates(_services.fates);
  Message message{std::move(payload), {}, category, type, 0};
  const auto refuse = [&](wire::Reason why) {
    hearOwner();
    static_cast<void>(refused(std::move(message), why, &fates));
  };
  if (!info || !info->int32(wire::kVeltraSessionInfoClientType) ||
      !info->uint32(wire::kVeltraSessionInfoSessionID)) {
    logError("sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo");
    return refuse(wire::Reason::no_identifiers);  // without a reply, which ends the client's call
  }
  _sessionID = info->uint32(wire::kVeltraSessionInfoSessionID).value_or(0);
  backends::SharedDictionary kept, identity;
  if (!charged(std::move(info), kept) || !charged(std::move(userInfo), identity))
    return refuse(wire::Reason::message_over_share);
  _sessionInfo = kept;
  hearOwner();
  receivedUserInfo(identity);
  logDebug("sendMessageWithSessionInfo: Sending message with session info for session %u", _sessionID);
  const auto storebag = _sessionDelegate.storebagForSession(*this);
  if (!storebag) {
    refuse(wire::Reason::no_storebag);
    if (reply) reply("storebag not available", {});
    return;
  }
  _services.counters.count(wire::Reason::one_shot_taken_in);
  hearOwner();
  const config::EditedFields edits = _ownerFilter.restrict(message.payload);
  wire::Outcomes outcomes;
  veltrad::session::sendMessageWithSessionInfo(
      {_services.factory, _services.device, _services.library, _services.clock, _services.counters,
       _ownerFilter.now(), _account, true, fates.comesFrom(storebag->origin, kept)},
      _services.messageLog,
      {familyFacts(), fates, _ownerFilter.allowed(identity), storebag.get(), std::move(message), &edits,
       reply ? &outcomes : nullptr});
  if (reply) reply("finished", std::move(outcomes));
}

void VeltradSession::end() {
  logDebug("dealloc: VeltradSession dealloc: %u", _sessionID);
  _leftFamily = true;
  Dictionary payload;
  payload.setIfPresent("StorebagVersion", _storebag.version());
  internalSendMessage(payload, 0, 1);
  flushMessagesWithCompletion(nullptr);
  if (const auto line = _aggregation->shutdownSessionAggregation(_sessionID)) logError("%s", line->c_str());
  // The session has left its family, so no more copies are sent to this client.
  if (const auto line = _aggregation->end()) logError("%s", line->c_str());
  const auto released = std::exchange(_backends, nullptr);
  _sessionInfo = nullptr;
  _userInfo = {};
  _storebag.forget();
  cleanUp(released.get());
}

}  // namespace veltrad::session
