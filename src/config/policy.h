// SPDX-License-Identifier: Apache-2.0
// The owner's policy from etc/veltrad/policy.json, and its verdicts on what may leave the device. Pure
// functions; any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "config/key_table.h"
#include "wire/reasons.h"

namespace veltrad::platform {
struct LocalContent;
}  // namespace veltrad::platform

namespace veltrad::config {

enum class Reporting { on, off };
void take(const Key& key, const Value& value, Reporting& field);

// Whether a storebag may report without the user's consent.
enum class ConsentRule { storebag, always };
void take(const Key& key, const Value& value, ConsentRule& field);

// "history": what left is kept for the owner to read.
struct HistoryBounds {
  std::int32_t days = 7;
  std::optional<std::int64_t> bytes = 67'108'864;

  bool operator==(const HistoryBounds&) const = default;
  static const KeyTable kKeys;
};
void take(const Key& key, const Value& value, std::optional<HistoryBounds>& field);

// The initial values are the defaults without the file.
struct PolicyRules {
  Reporting reporting = Reporting::on;
  ConsentRule consent = ConsentRule::storebag;
  TextList backends;  // not given: all
  TextList hosts;     // not given: all
  TextList remove;
  TextList hash;
  std::optional<std::int64_t> dailyEvents;
  std::optional<std::int64_t> dailyBytes;
  std::optional<HistoryBounds> history;

  bool operator==(const PolicyRules&) const = default;
  static const KeyTable kKeys;
};

// Immutable. A verdict can only restrict what a storebag allows.
class Policy {
 public:
  // Without limits.
  Policy() = default;
  explicit Policy(PolicyRules rules) : _rules(std::move(rules)) {}
  // A policy with which nothing leaves, for a file that is broken or could not be read yet.
  static std::shared_ptr<const Policy> closed();
  // Absent if the file is broken; `error` then says where: "PATH:LINE:COLUMN: text". An unknown key or a
  // value of a wrong type breaks it; a back end of an unknown name does not. `content` is good.
  static std::shared_ptr<const Policy> of(const platform::LocalContent& content, std::string& error);

  const PolicyRules& rules() const { return _rules; }
  bool broken() const { return _broken; }
  // The content of the file; absent without a good file.
  const std::optional<Dictionary>& asGiven() const { return _asGiven; }
  // Why no back end reports: policy_broken, policy_reporting, policy_consent; nothing: each may.
  std::optional<wire::Reason> refusal(bool consent) const;
  // Whether a back end of this name is made.
  bool makes(std::string_view backend) const;
  // Whether a server may be contacted. `host`: as an address has it, in letters of any case, an IPv6 address
  // with or without brackets. "*.example.com" in the policy means the names below example.com.
  bool reaches(std::string_view host) const;

 private:
  PolicyRules _rules;
  std::optional<Dictionary> _asGiven;
  bool _broken = false;
};

}  // namespace veltrad::config
