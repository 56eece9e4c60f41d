// VeltradSession: the daemon's side of one client connection. Its connection's thread makes every call, and
// nobody else reaches it: what others need of it, it tells them (FamilyFacts, Aggregation).
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "base/value.h"
#include "platform/clock.h"
#include "session/backend_set.h"
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

class Aggregation;
class FlushCounters;
class VeltradSessionDelegate;
struct FamilyFacts;

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
class VeltradSession final : public wire::ClientSessionInterface {
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

  std::uint32_t sessionID() const { return _sessionID; }
  const Aggregation& aggregation() const { return *_aggregation; }
  // Of the session info, for the choice of a storebag; absent when it names none.
  std::optional<std::int32_t> clientType() const;

 private:
  VeltradSession(const SessionServices& services, VeltradSessionDelegate& delegate,
                 std::shared_ptr<ipc::Connection> connection, std::string sessionIDString);

  void createBackendsWithStorebag(const config::StorebagSection& storebag);
  std::optional<std::vector<std::string>> fetchReportingStates() const;
  void updateSessionWithDefaultSessionInfo();
  void receivedUserInfo(backends::SharedDictionary userInfo);
  // What will be kept of it; false: too much, which is said and counted.
  bool charged(wire::OptionalDictionary given, backends::SharedDictionary& kept);
  void keepUserInfo(backends::SharedDictionary info);
  // Through the checks to the aggregating client and every backend; the answer for the client, or none.
  enum class Origin { client, session };  // whose message it is: the session's own are not missed
  std::optional<std::string> sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                     wire::OptionalDictionary payload,
                                                     Origin origin = Origin::client);
  std::optional<std::string> sendMessageWithDictionary(const Dictionary& message, Origin origin);
  void sayWithoutUserInfo();
  void aggregateMessage(std::int32_t hierarchy, double timestamp, std::uint16_t category, std::uint16_t type,
                        const Dictionary* payload);
  void internalSendMessage(const Dictionary& payload, std::uint16_t method, std::uint16_t respCode);

  FamilyFacts familyFacts() const;

  // Constant after construction.
  const SessionServices _services;
  VeltradSessionDelegate& _sessionDelegate;
  const std::string _sessionIDString;                       // base64 of 16 random bytes
  const std::shared_ptr<platform::MemoryAccount> _account;  // null: nobody pays
  const std::shared_ptr<Aggregation> _aggregation;

  // The connection's thread only.
  char _deviceid[41] = {};            // NUL-terminated; all zero while the device has no identifier
  bool _saidWithoutUserInfo = false;  // since the user info was last given
  std::uint32_t _sessionID = 0;
  backends::SharedDictionary _sessionInfo;      // null before it was given
  backends::SharedDictionary _userInfo;         // null: none
  std::shared_ptr<const BackendSet> _backends;  // null before the start, and where there is no storebag
  std::optional<std::string> _storebagVersion;
};

}  // namespace veltrad::session
