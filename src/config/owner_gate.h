// SPDX-License-Identifier: Apache-2.0
// Decides what may leave the device, from the owner's policy, consent and "reporting off". Any thread.
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

// The owner's decision at one time. Immutable.
struct OwnerDecision {
  std::shared_ptr<const Policy> policy = Policy::closed();
  // Why no back end reports; nothing: each may.
  std::optional<wire::Reason> refusal = wire::Reason::policy_broken;
  // Null: messages stay as they are.
  std::shared_ptr<const FieldRules> fields;
  // How often the owner has reset the identifiers since the start.
  std::uint64_t resets = 0;

  // Why a back end may not report; nothing: it may. `hosts`: those that it may send to. One host that the
  // policy allows is enough, because each request is checked again.
  std::optional<wire::Reason> refusalFor(std::string_view backend,
                                         const std::vector<std::string>& hosts) const;
};

// A file that cannot be read because of a shortage counts as unchanged.
class OwnerGate final : public http::RequestGate {
 public:
  // The arguments must outlive it; destinations and history may be null, then nothing is counted or recorded
  // there. Nothing may leave before the first refresh().
  OwnerGate(OwnerPolicy& policy, platform::Preferences& preferences, platform::DeviceSecret& secret,
            DailyAllowance& allowance, Destinations* destinations = nullptr,
            support::History* history = nullptr);

  // Reads changed files again. True if the decision has changed. One thread at a time.
  bool refresh();
  // To be called after identifiers and secret were replaced; the next refresh() publishes this.
  void identifiersReset() { _resets.fetch_add(1, std::memory_order_relaxed); }
  // The decision of the last refresh, never null.
  std::shared_ptr<const OwnerDecision> decision() const;
  // Grows with each change of the decision, so that readers detect a change cheaply.
  std::uint64_t turn() const { return _turn.load(std::memory_order_acquire); }
  // For a storebag request only the host is checked.
  std::optional<http::RequestRefusal> refusal(bool forStorebag, std::string_view host) const override;
  std::optional<http::RequestRefusal> count(const http::Departure& departure) override;
  // Counts a datagram, or the bytes of a transmission, for the daily limits only.
  bool mayLeave(std::uint64_t events, std::uint64_t bytes);
  // Takes such a count back, because nothing has left.
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
  // Everything that is dropped because of the owner's decision is added here.
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
  std::shared_ptr<const OwnerDecision> _decision GUARDED_BY(_mutex) = std::make_shared<const OwnerDecision>();
};

}  // namespace veltrad::config
