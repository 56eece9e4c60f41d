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
#include "config/field_rules.h"
#include "config/owner_policy.h"
#include "http/request_gate.h"
#include "wire/reasons.h"

namespace veltrad::platform {
class DeviceSecret;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::config {

// Immutable.
struct OwnersWord {
  std::shared_ptr<const Policy> policy = Policy::closed();
  // Why no back end reports; nothing: each may.
  std::optional<wire::Reason> refusal = wire::Reason::policy_broken;
  // Null: messages stay as they are.
  std::shared_ptr<const FieldRules> fields;

  // Why a back end may not report; nothing: it may. `hosts`: those that it may send to; one that the policy
  // lists suffices, because each request is asked for again.
  std::optional<wire::Reason> refusalFor(std::string_view backend,
                                         const std::vector<std::string>& hosts) const;
};

// What cannot be read for a shortage is no change.
class OwnerGate final : public http::RequestGate {
 public:
  // The arguments outlive it. Nothing may leave before the first refresh().
  OwnerGate(OwnerPolicy& policy, platform::Preferences& preferences, platform::DeviceSecret& secret,
            DailyAllowance& allowance);

  // Reads again what has changed. True if the word is another one.
  bool refresh();
  // The word of the last refresh, never null.
  std::shared_ptr<const OwnersWord> word() const;
  // Grows with each change of the word, so that its readers see cheaply that there is one.
  std::uint64_t turn() const { return _turn.load(std::memory_order_acquire); }
  // A request for a storebag is asked for its host alone.
  std::optional<http::RequestRefusal> refusal(bool forStorebag, std::string_view host) const override;
  std::optional<http::RequestRefusal> count(std::uint64_t events, std::uint64_t bytes) override;
  // The same for datagrams and other things that are no request.
  bool mayLeave(std::uint64_t events, std::uint64_t bytes);

 private:
  OwnerPolicy& _policy;
  platform::Preferences& _preferences;
  platform::DeviceSecret& _secret;
  DailyAllowance& _allowance;
  std::atomic<std::uint64_t> _turn{0};
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::shared_ptr<const OwnersWord> _word GUARDED_BY(_mutex) = std::make_shared<const OwnersWord>();
};

}  // namespace veltrad::config
