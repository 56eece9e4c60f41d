// SPDX-License-Identifier: Apache-2.0
// VeltradSession: the daemon's side of one client connection. Only the connection's thread calls it; other
// threads use its FamilyFacts and Aggregation.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "base/value.h"
#include "ipc/connection.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/locale.h"
#include "platform/memory_budget.h"
#include "platform/preferences.h"
#include "session/backend_set.h"
#include "session/given_storebag.h"
#include "session/owner_filter.h"
#include "session/session_fates.h"
#include "support/message_log.h"
#include "wire/client_session_interface.h"

namespace veltrad::session {

class Aggregation;
class FlushCounters;
class VeltradSessionDelegate;
struct FamilyFacts;
struct Message;

// The services of all sessions. They must outlive the sessions.
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
  const config::OwnerGate& gate;
  // Null: what becomes of messages is not recorded.
  platform::FateRing* fates = nullptr;
};

// The agent's list and the connection own it. The delegate must outlive it.
// Its 15 fields are its services, what its client has said, and what it got for that.
class VeltradSession final : public wire::ClientSessionInterface {
 public:
  static std::shared_ptr<VeltradSession> initWithSessionDelegate(const SessionServices& services,
                                                                 VeltradSessionDelegate& delegate,
                                                                 std::shared_ptr<ipc::Connection> connection);

  // The frameworks are ignored.
  bool setSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                      std::optional<Array> frameworksToCheck, bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(wire::NamesReply completionHandler) override;
  void fetchStatesWithUserInfo(wire::OptionalDictionary userInfo,
                               wire::NamesReply completionHandler) override;
  void fetchDisplayURL(wire::StringReply reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, wire::OptionalDictionary payload,
                               wire::SentReply reply) override;
  void sendMessageWithDictionary(Dictionary message, wire::SentReply reply) override;
  void flushMessagesWithCompletion(wire::FlushReply completion) override;
  void finishSessionWithReply(wire::StringReply reply) override;
  void uploadFileAtPath(std::string path, std::string extensionToken,
                        wire::BooleanReply completionHandler) override;
  void uploadLogData(Array logData, wire::UploadLogDataReply completionHandler) override;
  void sendMessageWithSessionInfo(wire::OptionalDictionary sessionInfo, wire::OptionalDictionary userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  wire::OptionalDictionary payload, wire::SentReply reply) override;
  // Takes over the daemon's current storebag, if sessions follow their storebags.
  void takeNews() override;
  // Sends the stop message, flushes, and cleans up and releases the back ends.
  void end() override;
  std::string description() const override;

  std::uint32_t sessionID() const { return _sessionID; }
  const Aggregation& aggregation() const { return *_aggregation; }
  // From the session info; selects the storebag.
  std::optional<std::int32_t> clientType() const;

 private:
  VeltradSession(const SessionServices& services, VeltradSessionDelegate& delegate,
                 std::shared_ptr<ipc::Connection> connection, std::string sessionIDString);

  // Applies the owner's decision if it has changed, also to the back ends.
  void hearOwner();
  // Makes the back ends of the current section. They take over from those in `before`, which may be null.
  void createBackends(const BackendSet* before);
  std::optional<std::vector<std::string>> fetchReportingStates() const;
  void updateSessionWithDefaultSessionInfo();
  void receivedUserInfo(const backends::SharedDictionary& userInfo);
  // Charges the dictionary to the user. False, and counted, if it is too much.
  bool charged(wire::OptionalDictionary given, backends::SharedDictionary& kept);
  void keepUserInfo(const backends::SharedDictionary& info);
  // The origin of a message; the session's own messages are not counted as lost.
  using Origin = SessionFates::From;
  // Applies the owner's decision first.
  bool hasBackends(Message& message, Origin origin);
  // These check the message and return the answer for the client. `outcomes` is null if nobody waits for
  // them.
  std::optional<std::string> sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                                     wire::OptionalDictionary payload,
                                                     wire::Outcomes* outcomes,
                                                     Origin origin = Origin::client);
  std::optional<std::string> sendMessageWithDictionary(Dictionary given, wire::Outcomes* outcomes);
  // Passes the message to the aggregating client and every back end.
  std::optional<std::string> sendMessage(Message message, wire::Outcomes* outcomes, Origin origin);
  // The record of fates, which knows what the session is.
  SessionFates& fates();
  // Counts and records why the client's message reaches no back end. Returns nothing.
  // `oneShot`: the record of a message without a session; null for one of the session.
  std::nullopt_t refused(Message message, wire::Reason why, SessionFates* oneShot = nullptr);
  void sayWithoutUserInfo();
  void internalSendMessage(const Dictionary& payload, std::uint16_t method, std::uint16_t respCode);

  FamilyFacts familyFacts() const;

  // Constant after construction.
  const SessionServices _services;
  VeltradSessionDelegate& _sessionDelegate;
  // Base64 of 16 random bytes.
  const std::string _sessionIDString;
  const std::shared_ptr<platform::MemoryAccount> _account;
  const std::shared_ptr<Aggregation> _aggregation;

  // NUL-terminated; empty while the device's identifier is unknown.
  char _deviceid[41] = {};
  // The line has been logged for the current user info.
  bool _saidWithoutUserInfo = false;
  std::uint32_t _sessionID = 0;
  backends::SharedDictionary _sessionInfo;
  backends::UserInfo _userInfo;
  OwnerFilter _ownerFilter;
  SessionFates _fates;
  // It must not join its family again.
  bool _leftFamily = false;
  std::shared_ptr<const BackendSet> _backends;
  GivenStorebag _storebag;
};

}  // namespace veltrad::session
