// SPDX-License-Identifier: Apache-2.0
// The entitlements of peers, from etc/veltrad/entitlements.plist or .json, which is read again after a
// change. Any thread.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "base/value.h"
#include "ipc/peer.h"
#include "platform/limited_line.h"
#include "platform/local_settings.h"

namespace veltrad::ipc {

// The state of the rules, for diagnosis.
struct RulesState {
  bool missing = false;               // there is no file
  std::string error;                  // why it cannot be used; empty: it can
  std::vector<std::string> warnings;  // about single rules
  bool grants = false;                // some rule grants the entitlement to somebody
};

// The file is an array of rules, each {"uid": n | "gid": n | "unit": text, "entitlements": {name: value}}; a
// rule with more than one of the three matches when all of them match, one with none never. A missing or
// unreadable file grants nothing; an unreadable or malformed file is one error for each change. A rule of a
// wrong type grants nothing, and one warning for each change says what was expected. During a shortage the
// last rules apply, and the file is read again at the next call.
class Entitlements {
 public:
  // `path`: of either form.
  Entitlements(platform::FileStore& files, const std::string& path);
  // The first matching rule's value; only a boolean true is a grant, and that is the caller's to check.
  std::optional<Value> valueForEntitlement(std::string_view name, const Peer& peer);
  // The state of the file, and whether any rule grants this entitlement. Absent if the file cannot be read at
  // the moment.
  std::optional<RulesState> stateFor(std::string_view name);
  // False: no rule grants it to this user, whatever groups and unit a process of his has.
  bool mayHold(std::string_view name, unsigned uid);
  // Reads the file now, whether it has changed or not.
  void readAgain();

 private:
  struct Said;
  void refresh(Said& said) REQUIRES(_mutex);
  void say(const Said& said);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  platform::LocalSettings _file GUARDED_BY(_mutex);
  std::shared_ptr<const platform::LocalContent> _content GUARDED_BY(_mutex);  // what the rules are from
  Array _rules GUARDED_BY(_mutex);
  RulesState _state GUARDED_BY(_mutex);  // of that reading, without `grants`
  platform::LimitedLine _shortages{"questions"};
};

// The decisions, exposed for tests.
bool mayHoldByRules(const Array& rules, std::string_view name, unsigned uid);
std::optional<Value> entitlementInRules(const Array& rules, std::string_view name, const Peer& peer);

}  // namespace veltrad::ipc
