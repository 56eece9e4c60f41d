// A session's life: creation, configuration, start, state queries, the end.
#include "session/veltrad_session.h"

#include <fmt/format.h>

#include "base/base64.h"
#include "ipc/connection.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "platform/uuid.h"
#include "session/kept_info.h"
#include "session/session_delegate.h"
#include "session/start_message.h"
#include "support/device_identity.h"
#include "wire/constants.h"

namespace veltrad::session {

namespace {
// String equality of the names that make an identity; a name missing on the new side counts as a change.
bool sameName(const Dictionary& current, const Dictionary& updated, const char* key) {
  const std::string* before = current.string(key);
  const std::string* now = updated.string(key);
  return before && now && *before == *now;
}

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
      _account(connection ? connection->memoryAccount() : nullptr),
      _connection(std::move(connection)) {
  _services.device.copyUniqueDeviceID(_deviceid, sizeof _deviceid);
}

VeltradSession::~VeltradSession() = default;

std::string VeltradSession::description() const {
  return fmt::format("<VeltradSession: {}>", fmt::ptr(this));
}

std::optional<std::string> VeltradSession::storebagVersion() const {
  const Lock held(_mutex);
  return _storebagVersion;
}

backends::SharedDictionary VeltradSession::sessionInfo() const {
  const Lock held(_mutex);
  return _sessionInfo;
}

backends::SharedDictionary VeltradSession::userInfo() const {
  const Lock held(_mutex);
  return _userInfo;
}

std::shared_ptr<const BackendSet> VeltradSession::backends() const {
  const Lock held(_mutex);
  return _backends;
}

std::string VeltradSession::deviceID() const {
  return _deviceid;
}

std::optional<std::int32_t> VeltradSession::clientType() const {
  const backends::SharedDictionary info = sessionInfo();
  return info ? info->int32(wire::kVeltraSessionInfoClientType) : std::nullopt;
}

bool VeltradSession::setSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                                    std::optional<Array>, bool hasAggregationBlock) {
  backends::SharedDictionary info;
  backends::SharedDictionary identity;
  if (!charged(std::move(sessionInfo), info) || !charged(std::move(userInfo), identity)) return false;
  const std::uint32_t number = info ? info->uint32(wire::kVeltraSessionInfoSessionID).value_or(0) : 0;
  _sessionID.store(number, std::memory_order_relaxed);
  logDebug("setSessionInfo: Configuring session %u", number);
  const bool required = info && info->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false);
  if (identity && !required) {
    logWarning("setSessionInfo: Configure session: user info provided without requiring it");
  }
  keepSessionInfo(std::move(info));
  keepUserInfo(std::move(identity));
  _hasAggregator.store(hasAggregationBlock, std::memory_order_relaxed);
  return true;
}

bool VeltradSession::charged(wire::OptionalDictionary given, backends::SharedDictionary& kept) {
  if (!given) return true;
  kept = keptInfo(std::move(*given), _account);
  if (!kept) _services.counters.count(wire::Reason::info_over_share);
  return kept != nullptr;
}

void VeltradSession::keepSessionInfo(backends::SharedDictionary info) {
  const Lock held(_mutex);
  _sessionInfo.swap(info);
}

void VeltradSession::keepUserInfo(backends::SharedDictionary info) {
  _saidWithoutUserInfo = false;
  const Lock held(_mutex);
  _userInfo.swap(info);
}

void VeltradSession::startConfigWithCompletionHandler(wire::NamesReply completionHandler) {
  logDebug("startConfigWithCompletionHandler: Starting configuration for session %u", sessionID());
  const auto storebag = _sessionDelegate.storebagForSession(*this);
  if (!storebag) {
    _services.counters.count(wire::Reason::start_without_storebag);
    if (completionHandler) completionHandler(std::nullopt);
    return;
  }
  auto version = _sessionDelegate.storebagVersionForSession(*this);
  {
    const Lock held(_mutex);
    _storebagVersion = std::move(version);
  }
  createBackendsWithStorebag(*storebag);
  updateSessionWithDefaultSessionInfo();
  sendStartMessage();
  if (completionHandler) completionHandler(fetchReportingStates());
}

void VeltradSession::createBackendsWithStorebag(const config::StorebagSection& storebag) {
  logDebug("createBackendsWithStorebag: Creating backends for session %u", sessionID());
  const backends::SharedDictionary info = sessionInfo();
  // It may have been out of reach when the client connected.
  if (_deviceid[0] == '\0') _services.device.copyUniqueDeviceID(_deviceid, sizeof _deviceid);
  auto made =
      createBackends({_services.factory, _services.device, _services.library, _services.clock, _account},
                     &storebag, info.get(), userInfo(), deviceID());
  if (made) {
    for (const auto& [name, backend] : *made) backend->setCombinedSessionIDString(_sessionIDString);
  }
  {
    const Lock held(_mutex);
    _backends.swap(made);
  }
  // A second start: what it replaced is let go in order.
  if (made) {
    for (const auto& [name, backend] : *made) backend->cleanup();
  }
}

void VeltradSession::sendStartMessage() {
  internalSendMessage(
      startMessagePayload(_services.device, _services.library, _services.preferences, _services.locale), 0,
      0);
}

void VeltradSession::updateSessionWithDefaultSessionInfo() {
  _sessionDelegate.userInfoUpdatedForSession(shared_from_this());
  refreshStates();
}

void VeltradSession::refreshStates() {
  updateReportingStates();
  _sessionDelegate.updateDownstreamSessions(shared_from_this());
}

void VeltradSession::updateReportingStates() {
  if (const auto set = backends()) {
    for (const auto& [name, backend] : *set) backend->updateState();
  }
}

void VeltradSession::updateUserInfoForBackends() {
  const backends::SharedDictionary info = userInfo();
  if (const auto set = backends()) {
    for (const auto& [name, backend] : *set) backend->setUserInfoDict(info);
  }
}

std::optional<std::vector<std::string>> VeltradSession::fetchReportingStates() const {
  const auto set = backends();
  if (!set) return std::nullopt;
  return reportingNames(*set);
}

void VeltradSession::fetchStatesWithUserInfo(wire::OptionalDictionary userInfo,
                                             wire::NamesReply completionHandler) {
  logDebug("fetchStatesWithUserInfo: Fetching states for session %u", sessionID());
  backends::SharedDictionary identity;
  if (charged(std::move(userInfo), identity)) receivedUserInfo(std::move(identity));
  if (completionHandler) completionHandler(fetchReportingStates());
}

void VeltradSession::receivedUserInfo(backends::SharedDictionary updated) {
  const backends::SharedDictionary current = userInfo();
  if (!updated) {
    if (!current) return;
    const backends::SharedDictionary info = sessionInfo();
    if (info && info->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false)) return;
  }
  const bool unchanged = current && updated &&
                         sameName(*current, *updated, wire::kVeltraUserInfoClientName) &&
                         sameName(*current, *updated, wire::kVeltraUserInfoServiceName);
  const auto take = [this, &updated] {
    keepUserInfo(std::move(updated));
    updateUserInfoForBackends();
  };
  if (unchanged) return take();
  const auto self = shared_from_this();
  _sessionDelegate.changeIdentity([&] {
    take();
    logDebug("receivedUserInfo: Received new user info for session %u", sessionID());
    _sessionDelegate.userInfoUpdatedForSession(self);
  });
  refreshStates();
}

void VeltradSession::fetchDisplayURL(wire::StringReply reply) {
  logDebug("fetchDisplayURL: Fetching display URL for session %u", sessionID());
  std::string url = "URL not available";
  if (const auto set = backends()) {
    for (const char* name :
         {wire::kVeltraBackendHTTPPost, wire::kVeltraBackendHTTPPost2, wire::kVeltraBackendDashboard}) {
      const auto at = set->find(name);
      const auto display = at == set->end() ? std::nullopt : at->second->displayURL();
      if (!display) continue;
      url = *display;
      break;
    }
  }
  if (reply) reply(url);
}

std::int32_t VeltradSession::getSessionHierarchy() const {
  const auto set = backends();
  if (!set) return 0;
  for (const char* name : {wire::kVeltraBackendHTTPPost2, wire::kVeltraBackendHTTPPost}) {
    const auto at = set->find(name);
    if (at != set->end()) return at->second->hierarchy();
  }
  return 0;
}

void VeltradSession::syncReportingStates() {
  const auto mine = backends();
  const auto parent = _sessionDelegate.parentSessionForChild(*this);
  const auto theirs = parent ? parent->backends() : nullptr;
  if (!mine) return;
  for (const auto& [name, backend] : *mine) {
    if (!parent) {
      if (backend->hierarchy() >= 1) {
        logInfo("syncReportingStates: child session %u (backend %s) with hierarchy %d is missing its parent",
                sessionID(), backend->name().c_str(), backend->hierarchy());
      }
      continue;
    }
    if (backend->state() == backends::kBackendHeld) continue;
    const auto at = theirs ? theirs->find(name) : BackendSet::const_iterator();
    if (!theirs || at == theirs->end()) {
      backend->setState(backends::kBackendDisabled);
      continue;
    }
    backend->setState(at->second->state());
    backend->setSamplingThreshold(at->second->samplingThreshold());
    logDebug("HTTPSPostBackend(syncReportingStates): %s: state and sampling rate updated to %d, %.02f%%",
             backend->name().c_str(), backend->state(), backend->samplingThreshold().value_or(0));
  }
}

void VeltradSession::updateCombinedSessionID() {
  const auto ancestors = _sessionDelegate.parentSessionIDStringForSession(*this);
  if (!ancestors) return;
  const std::string combined = *ancestors + "." + _sessionIDString;
  logDebug("updateCombinedSessionID: Updating combined session ID '%s' for session %u backends",
           combined.c_str(), sessionID());
  if (const auto set = backends()) {
    for (const auto& [name, backend] : *set) backend->setCorrelatedSessionID(combined);
  }
}

void VeltradSession::end() {
  logDebug("dealloc: VeltradSession dealloc: %u", sessionID());
  Dictionary payload;
  payload.setIfPresent("StorebagVersion", storebagVersion());
  internalSendMessage(payload, 0, 1);
  flushMessagesWithCompletion(nullptr);
  if (const auto line = shutdownSessionAggregation()) logError("%s", line->c_str());
  // Nobody sends to this client any more: the invalidation has taken the session from its list.
  if (const auto line = _dropLine.rest()) logError("%s", line->c_str());
  std::shared_ptr<const BackendSet> released;
  std::shared_ptr<ipc::Connection> connection;  // may be the last reference: goes after the lock
  {
    const Lock held(_mutex);
    released.swap(_backends);
    connection.swap(_connection);
    _sessionInfo = nullptr;
    _userInfo = nullptr;
    _storebagVersion = std::nullopt;
  }
  if (released) {
    for (const auto& [name, backend] : *released) backend->cleanup();
  }
}

}  // namespace veltrad::session
