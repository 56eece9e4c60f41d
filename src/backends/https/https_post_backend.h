// SPDX-License-Identifier: Apache-2.0
// HTTPSPostBackend: posts messages as JSON events, at once or in batches. The session's thread sends and
// flushes; another session's thread may call setCorrelatedSessionID; answers come on the HTTP thread.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "backends/https/held_events.h"
#include "backends/https/https_post_state.h"
#include "backends/https/json_message.h"

namespace veltrad::backends {

class EventPosts;

// What an HTTPS post back end uses. The references outlive it.
struct HTTPSPostMaking {
  platform::Random& random;
  platform::Locale& locale;
  platform::Counters& counters;
  EventPosts& posts;
  platform::FatePen pen;
  PostIdentity::Sources identity;
};

class HTTPSPostBackend final : public VeltraBackend {
 public:
  // Null without a profile, a product family or, after an error line, the profile's "clients".
  static std::shared_ptr<HTTPSPostBackend> initWithName(
      const HTTPSPostMaking& making, const std::string& name,
      std::shared_ptr<const config::HTTPSPostProfile> profile,
      const std::optional<std::string>& productFamily);

  void updateState() override;
  Sent sendNumberedMessage(NumberedMessage&& message) override;
  std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion) override;
  void setCorrelatedSessionID(const std::string& sessionID) override;
  BackendActivity activity() const override;
  std::vector<std::string> hosts() const override;
  bool hostsAreFixed() const override { return false; }

 private:
  void dropWaiting() override;

  HTTPSPostBackend(const HTTPSPostMaking& making, const std::string& name,
                   std::shared_ptr<const config::HTTPSPostProfile> profile, const std::string& productFamily);

  void addStopFields(Dictionary& payload, bool batching) const;
  // Counts the changes; `changes` hears the names.
  void filterEvent(Dictionary& event, config::FieldChanges& changes) const;
  Sent batchEvent(Dictionary event, const NumberedMessage& message, platform::MemoryAccount* account,
                  std::uint64_t sessionIDChanges);
  Sent postEvent(Dictionary event, const SessionFacts& facts, const NumberedMessage& message);
  Dictionary refilled(const SessionFacts& facts, std::uint64_t batch) const;
  ClientMatch clientMatch() const override { return _clientState.match(); }
  // `eventBytes` is an upper bound on the events' JSON texts.
  JSONMessage createMessage(std::vector<Dictionary> events, const SessionFacts& facts,
                            std::size_t eventBytes) const;

  platform::Locale& _locale;
  platform::Counters& _counters;
  EventPosts& _posts;

  // The session's thread only.
  HTTPSPostState _clientState;
  // The batch is registered with the user's account.
  bool _evictable = false;

  const std::shared_ptr<HeldEvents> _held;
};

}  // namespace veltrad::backends
