// SPDX-License-Identifier: Apache-2.0
// HTTPSPostBackend: posts messages as JSON events, at once or in batches. The session's thread sends and
// flushes; another session's thread may call setCorrelatedSessionID; answers come on the HTTP thread.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "backends/https/event.h"
#include "backends/https/held_events.h"
#include "backends/https/https_post_state.h"
#include "backends/https/json_message.h"

namespace veltrad::config {
class OwnerGate;
}  // namespace veltrad::config

namespace veltrad::backends {

class EventPosts;

// The services of an HTTPS post back end. The references must outlive it.
struct HTTPSPostMaking {
  platform::Random& random;
  platform::Locale& locale;
  platform::Counters& counters;
  EventPosts& posts;
  platform::FateWriter pen;
  PostIdentity::Sources identity;
  // Null: the owner sets no limits.
  config::OwnerGate* gate = nullptr;
};

class HTTPSPostBackend final : public VeltraBackend {
 public:
  // Null without a profile, a product family or, after an error line, the profile's "clients".
  static std::shared_ptr<HTTPSPostBackend> initWithName(
      const HTTPSPostMaking& making, const std::string& name,
      const std::shared_ptr<const config::HTTPSPostProfile>& profile,
      const std::optional<std::string>& productFamily);

  void takeOver(VeltraBackend& before) override;
  void updateState() override;
  Sent sendNumberedMessage(NumberedMessage&& message) override;
  std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion) override;
  void setCorrelatedSessionID(const std::string& sessionID) override;
  void takeIdentity(const std::string& udid) override;
  void rereadConsent() override { _clientState.rereadConsent(); }
  BackendActivity activity() const override;
  std::vector<std::string> hosts() const override;
  bool hostsAreFixed() const override { return false; }
  // The state with its details, for tools. The session's thread.
  const HTTPSPostState& clientState() const { return _clientState; }

 private:
  void dropWaiting() override;

  HTTPSPostBackend(const HTTPSPostMaking& making, const std::string& name,
                   const std::shared_ptr<const config::HTTPSPostProfile>& profile,
                   const std::string& productFamily);

  void addStopFields(Dictionary& payload, bool batching) const;
  void count(const FilterTable::Outcome& outcome) const;
  WrittenEvent writeEvent(const SessionFacts& facts, const NumberedMessage& message);
  void noteUserInfo(const SessionFacts& facts);
  Sent batchEvent(WrittenEvent event, const NumberedMessage& message, platform::MemoryAccount* account,
                  std::uint64_t sessionIDChanges);
  Sent postEvent(WrittenEvent event, const SessionFacts& facts, const NumberedMessage& message);
  // Merges the present user info into the events. False if there is no memory for it.
  bool mergeUserInfo(HeldEvents::Taken& taken, const SessionFacts& facts, config::EditedFields& edits);
  JSONMessage createMessage(std::vector<std::string> events, const SessionFacts& facts) const;
  ClientMatch clientMatch() const override { return _clientState.match(); }
  // For the record of fates: what was changed in an event, and then by the user info of a flush.
  void noteEdits(const SessionFacts& facts, const NumberedMessage& message,
                 const config::EditedFields& edits) const;
  void noteMerge(const SessionFacts& facts, const config::EditedFields& edits, std::uint64_t batch) const;
  // For the history of what left, if one is kept: names of fields that the owner withholds, too.
  bool recorded() const;
  void addOwnersEdits(const SessionFacts& facts, const MessageNote& note, config::EditedFields& edits) const;
  Dictionary about(const SessionFacts& facts, const config::EditedFields& edits) const;

  platform::Locale& _locale;
  platform::Counters& _counters;
  EventPosts& _posts;
  config::OwnerGate* const _gate;

  // The session's thread only.
  HTTPSPostState _clientState;
  // The batch is registered with the user's account.
  bool _evictable = false;
  // The user info with which the settled events of the batch were written.
  SharedDictionary _writtenInfo;
  FilterTable _writtenFilters;
  // The length of the last event; most later ones are similar.
  std::size_t _lastLength = 0;
  // The changed fields of the events in the batch, possibly with those of dropped events.
  config::EditedFields _batchEdits;

  // Shared with the back end before, if this one has taken over from it. Constant once others know this one.
  std::shared_ptr<HeldEvents> _held;
};

}  // namespace veltrad::backends
