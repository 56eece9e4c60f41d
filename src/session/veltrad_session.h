// VeltradSession: the daemon's side of one client connection. Its connection's thread makes every call; the
// agent and other sessions read what is guarded.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "base/mutex.h"
#include "base/value.h"
#include "platform/clock.h"
#include "platform/limited_line.h"
#include "session/backend_set.h"
#include "session/lock_ranks.h"
#include "wire/client_session_interface.h"

namespace veltrad::ipc {
class Connection;
}  // namespace veltrad::ipc

namespace veltrad::platform {
class Counters;
class Locale;
class MemoryAccount;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class MessageLog;
}  // namespace veltrad::support

namespace veltrad::session {

class FlushCounters;
class VeltradSessionDelegate;

// What every session uses. Everything outlives the sessions.
struct SessionServices {
  backends::BackendFactory& factory;
  support::DeviceIdentity& device;
  const support::Veltra& library;
  platform::Clock& clock;
  platform::Preferences& preferences;
  platform::Locale& locale;
  platform::Counters& counters;
  FlushCounters& flushes;
  support::MessageLog& messageLog;
};

// The delegate outlives it. Nothing else owns it for long but the agent's list and the connection.
class VeltradSession final : public wire::ClientSessionInterface,
                             public std::enable_shared_from_this<VeltradSession> {
 public:
  static std::shared_ptr<VeltradSession> initWithSessionDelegate(const SessionServices& services,
                                                                 VeltradSessionDelegate& delegate,
                                                                 std::shared_ptr<ipc::Connection> connection);
  ~VeltradSession() override;

  // The frameworks are not looked at.
  bool setSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                      std::optional<Array> frameworksToCheck, bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(wire::NamesReply completionHandler) override;
  void fetchStatesWithUserInfo(wire::OptionalDictionary userInfo,
                               wire::NamesReply completionHandler) override;
  void fetchDisplayURL(wire::StringReply reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, wire::OptionalDictionary payload,
                               wire::StringReply reply) override;
  void sendMessageWithDictionary(Dictionary message, wire::StringReply reply) override;
  void flushMessagesWithCompletion(wire::FlushReply completion) override;
  void finishSessionWithReply(wire::StringReply reply) override;
  void uploadFileAtPath(std::string path, std::string extensionToken,
                        wire::BooleanReply completionHandler) override;
  void uploadLogData(Array logData, wire::UploadLogDataReply completionHandler) override;
  void sendMessageWithSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  wire::OptionalDictionary payload, wire::StringReply reply) override;
  // Sends the stop message, flushes, cleans the backends up and lets go of everything.
  void end() override;
  std::string description() const override;

  // Any thread.
  std::uint32_t sessionID() const { return _sessionID.load(std::memory_order_relaxed); }
  const std::string& sessionIDString() const { return _sessionIDString; }
  std::optional<std::string> storebagVersion() const;
  backends::SharedDictionary sessionInfo() const;  // null before it was given
  backends::SharedDictionary userInfo() const;     // null: none
  bool hasAggregator() const { return _hasAggregator.load(std::memory_order_relaxed); }
  // The number that the HTTPS post backend takes from its client entry; 0: root.
  std::int32_t getSessionHierarchy() const;
  // For the registry, which holds its lock: takes over the parent's states and sampling thresholds, back end
  // by back end; one in state 3 keeps its own, one that the parent lacks is disabled.
  void syncReportingStates();
  // Gives the back ends the ancestors' ID strings and this session's own, joined by ".".
  void updateCombinedSessionID();
  // Tells the client that no more copies come, if any came. The line to log, once no lock is held.
  [[nodiscard]] std::optional<std::string> shutdownSessionAggregation();
  // The client type of the session info, for the choice of a storebag; absent when it names none.
  std::optional<std::int32_t> clientType() const;

 private:
  VeltradSession(const SessionServices& services, VeltradSessionDelegate& delegate,
                 std::shared_ptr<ipc::Connection> connection, std::string sessionIDString);

  void sendStartMessage();
  void createBackendsWithStorebag(const config::StorebagSection& storebag);
  void updateUserInfoForBackends();
  void updateReportingStates();
  std::optional<std::vector<std::string>> fetchReportingStates() const;
  void updateSessionWithDefaultSessionInfo();
  void refreshStates();
  void receivedUserInfo(backends::SharedDictionary userInfo);
  // What is kept for the session's life goes through these two.
  // What will be kept of it; false: too much, which is said and counted.
  bool charged(wire::OptionalDictionary given, backends::SharedDictionary& kept);
  void keepSessionInfo(backends::SharedDictionary info);
  void keepUserInfo(backends::SharedDictionary info);
  // Through the checks to the aggregating client and every backend; the answer for the client, or none.
  enum class Origin { client, session };  // whose message it is: the session's own are not missed
  std::optional<std::string> sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                     wire::OptionalDictionary payload,
                                                     Origin origin = Origin::client);
  std::optional<std::string> sendMessageWithDictionary(const Dictionary& message, Origin origin);
  void sayWithoutUserInfo();
  void aggregateMessage(const backends::SharedDictionary& sessionInfo, double timestamp,
                        std::uint16_t category, std::uint16_t type, const Dictionary* payload);
  // To this session's own client, without waiting; the registry's lock may be held. The line to log, once no
  // lock is held, about a copy that was lost.
  std::optional<std::string> sendToAggregator(const backends::SharedDictionary& sessionInfo, double timestamp,
                                              std::uint16_t category, std::uint16_t type,
                                              wire::OptionalDictionary payload);
  std::optional<std::string> offerToBackends(const BackendSet& backends, const Dictionary* payload,
                                             platform::TimeValue time, std::uint16_t category,
                                             std::uint16_t type, std::int32_t flag);
  void internalSendMessage(const Dictionary& payload, std::uint16_t method, std::uint16_t respCode);
  void internalFlushMessagesWithCompletion(wire::FlushReply completion);

  std::shared_ptr<const BackendSet> backends() const;
  std::string deviceID() const;

  // Constant after construction.
  const SessionServices _services;
  VeltradSessionDelegate& _sessionDelegate;
  const std::string _sessionIDString;                       // base64 of 16 random bytes
  const std::shared_ptr<platform::MemoryAccount> _account;  // null: nobody pays

  // The connection's thread only.
  char _deviceid[41] = {};            // NUL-terminated; all zero while the device has no identifier
  bool _saidWithoutUserInfo = false;  // since the user info was last given

  std::atomic<std::uint32_t> _sessionID{0};
  std::atomic<bool> _hasAggregator{false};

  mutable Mutex _mutex SESSION_LOCK;
  std::shared_ptr<ipc::Connection> _connection GUARDED_BY(_mutex);
  backends::SharedDictionary _sessionInfo GUARDED_BY(_mutex);
  backends::SharedDictionary _userInfo GUARDED_BY(_mutex);
  std::shared_ptr<const BackendSet> _backends GUARDED_BY(_mutex);
  std::optional<std::string> _storebagVersion GUARDED_BY(_mutex);

  // Any thread.
  platform::LimitedLine _dropLine{"copies"};  // of copies to this session's own client
};

}  // namespace veltrad::session
