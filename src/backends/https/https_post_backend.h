// HTTPSPostBackend: messages become JSON events, posted at once or in batches. The session's thread sends and
// flushes; setCorrelatedSessionID may come from another session's thread; answers come on the HTTP thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "backends/https/client_decision.h"
#include "backends/https/filter_table.h"
#include "backends/https/held_events.h"
#include "backends/https/post_errors.h"
#include "backends/https/post_request.h"

namespace veltrad::backends {

class HTTPSPostBackend final : public VeltraBackend {
 public:
  // Null without a profile, a product family or the profile's "clients" (one error line).
  static std::shared_ptr<HTTPSPostBackend> initWithName(
      const BackendServices& services, PostErrors& errors, const std::string& name,
      std::shared_ptr<const config::HTTPSPostProfile> profile,
      const std::optional<std::string>& productFamily);

  void updateState() override;
  using VeltraBackend::sendMessage;
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID,
                                         std::int32_t flag) override;
  std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion) override;
  void setCorrelatedSessionID(const std::string& sessionID) override;

  const std::optional<std::string>& postURL() const { return _postURL; }

 private:
  HTTPSPostBackend(const BackendServices& services, PostErrors& errors, const std::string& name,
                   std::shared_ptr<const config::HTTPSPostProfile> profile, const std::string& productFamily);

  std::int32_t updateBackendState();
  void applyExpedite(const config::ClientEntry& entry);
  std::int32_t reportForEveryone();
  std::int32_t reportForClient(const config::ClientEntry& entry, const std::optional<std::string>& clientName,
                               const std::optional<std::string>& serviceName);
  void logRefusal(const config::ClientEntry& entry, const ClientVerdict& verdict,
                  const std::optional<std::string>& country) const;
  void takeSampling(const ClientVerdict& verdict, const std::optional<std::string>& country);
  std::optional<std::string> getPersistentIdentifierForCustomClientIDSuffix(
      const std::optional<std::string>& clientName, const std::optional<std::string>& serviceName) const;
  bool updatePostLink(const config::ClientEntry& entry);
  void resetBackendStateWithClient(const config::ClientEntry* entry);

  Dictionary withStopFields(const Dictionary* payload) const;
  void prepareEventForMessage(Dictionary& event) const;
  void filterEvent(Dictionary& event) const;
  void restrict(Dictionary& event) const;
  std::optional<std::string> batchEvent(Dictionary event, std::uint64_t sessionIDChanges);
  wire::Reason keep(Dictionary event, const EventSize& size, std::int32_t method,
                    std::uint64_t sessionIDChanges);
  std::optional<std::string> postEvent(Dictionary event, bool realtime, std::uint16_t method,
                                       std::uint16_t respCode, std::int32_t flag);
  // The compact JSON; `pretty` gets the readable copy where logging is allowed.
  std::string createMessageForPostAndLogging(std::vector<Dictionary> events,
                                             std::optional<std::string>& pretty);
  const std::string& clientIdentifier() const;
  bool loggingAllowed() const;
  // Nothing is kept for what is not posted: such events are lost, counted, and `completion` is told.
  void refusePost(std::size_t eventCount, const FlushCompletion& completion);
  // `charge` pays for the post and, with `completionBytes`, for what its completion keeps.
  void postJSONMessage(std::string json, std::int32_t withFlag, std::optional<EventMap> eventMap,
                       std::size_t eventCount, platform::Charge charge, std::size_t completionBytes,
                       FlushCompletion completion);
  // HTTP thread. Nothing: the post ended without an error.
  std::optional<wire::ReportingError> handleAnswer(const http::HTTPResult& result, const std::string& url,
                                                   std::size_t eventCount);

  // Constant after construction.
  const BackendServices _services;
  const std::shared_ptr<const config::HTTPSPostProfile> _profile;
  PostErrors& _errors;
  const bool _dnuEnabled;
  const bool _forceEventLogging;
  const std::string _uuidRespectDnu;
  const std::string _uuidOverrideDnu;

  // The session's thread only.
  std::optional<std::string> _postURL;
  bool _useDefaultPostURL = false;
  std::optional<std::string> _realtimePostURL;
  bool _useDefaultRealtimePostURL = false;
  std::int32_t _dnuType = 0;
  std::int32_t _eventThreshold = 49;
  std::int32_t _extrasOnInternal = 0;
  std::optional<double> _overrideSampling;
  std::optional<std::string> _uuidCustom;
  FilterTable _filters;
  bool _evictable = false;  // the user's account knows the batch

  const std::shared_ptr<HeldEvents> _held;
};

// "forceEventLogging": true when the text, after blanks, a sign and zeros, begins with Y, y, T, t or a digit
// 1 to 9.
bool textMeansYes(const std::optional<std::string>& text);

}  // namespace veltrad::backends
