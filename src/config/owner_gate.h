// SPDX-License-Identifier: Apache-2.0
// The owner's word on what may leave the device: policy, consent and "reporting off" together. Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "config/daily_allowance.h"
#include "config/destinations.h"
#include "config/drop_receipt.h"
#include "config/field_rules.h"
#include "config/owner_policy.h"
#include "http/request_gate.h"
#include "wire/reasons.h"

namespace veltrad::platform {
class DeviceSecret;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class History;
}  // namespace veltrad::support

namespace veltrad::config {

// Immutable.
struct OwnersWord {
  std::shared_ptr<const Policy> policy = Policy::closed();
  // Why no back end reports; nothing: each may.
  std::optional<wire::Reason> refusal = wire::Reason::policy_broken;
  // Null: messages stay as they are.
  std::shared_ptr<const FieldRules> fields;
  // How often the owner has reset the identifiers since the start.
  std::uint64_t resets = 0;

  // Why a back end may not report; nothing: it may. `hosts`: those that it may send to; one that the policy
  // lists suffices, because each request is asked for again.
  std::optional<wire::Reason> refusalFor(std::string_view backend,
                                         const std::vector<std::string>& hosts) const;
};

// What cannot be read for a shortage is no change.
class OwnerGate final : public http::RequestGate {
 public:
  // The arguments outlive it; without destinations and a history, nobody keeps account. Nothing may leave
  // before the first refresh().
  OwnerGate(OwnerPolicy& policy, platform::Preferences& preferences, platform::DeviceSecret& secret,
            DailyAllowance& allowance, Destinations* destinations = nullptr,
            support::History* history = nullptr);

  // Reads again what has changed. True if the word is another one. One thread at a time.
  bool refresh();
  // The identifiers and the secret are others now; the next refresh() says so.
  void identifiersReset() { _resets.fetch_add(1, std::memory_order_relaxed); }
  // The word of the last refresh, never null.
  std::shared_ptr<const OwnersWord> word() const;
  // Grows with each change of the word, so that its readers see cheaply that there is one.
  std::uint64_t turn() const { return _turn.load(std::memory_order_acquire); }
  // A request for a storebag is asked for its host alone.
  std::optional<http::RequestRefusal> refusal(bool forStorebag, std::string_view host) const override;
  std::optional<http::RequestRefusal> count(const http::Departure& departure) override;
  // Counts for the limits of a day alone: a datagram, or the bytes of a transmission.
  bool mayLeave(std::uint64_t events, std::uint64_t bytes);
  // What was counted so has not left.
  void didNotLeave(std::uint64_t events, std::uint64_t bytes) { _allowance.giveBack(events, bytes); }
  // A datagram has been sent; `events`: 0 for its further transmissions.
  void datagramLeft(std::string_view to, std::uint64_t events, std::uint64_t bytes);
  bool keepsRecords() const override;
  bool hasRoomForRecord() const override;
  std::uint64_t record(const http::Departure& departure, std::vector<std::string> headerLines,
                       std::string_view body, std::shared_ptr<const FileDescriptor> file) override;
  void ended(std::uint64_t record, const http::DepartureEnd& end) override;
  void refused(const http::Departure& departure) override {
    _receipt.add(departure.kind, departure.client, departure.events);
  }
  // Whoever drops something for the owner's sake adds it.
  DropReceipt& receipt() { return _receipt; }

 private:
  OwnerPolicy& _policy;
  platform::Preferences& _preferences;
  platform::DeviceSecret& _secret;
  DailyAllowance& _allowance;
  Destinations* const _destinations;
  support::History* const _history;
  std::atomic<std::uint64_t> _turn{0};
  std::atomic<std::uint64_t> _resets{0};
  DropReceipt _receipt;
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::shared_ptr<const OwnersWord> _word GUARDED_BY(_mutex) = std::make_shared<const OwnersWord>();
};

}  // namespace veltrad::config
