// Who may do what: etc/veltrad/entitlements.plist, reread when it changed. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"
#include "base/value.h"
#include "ipc/peer.h"
#include "platform/limited_line.h"

namespace veltrad::platform {
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::ipc {

// What the rules give, for those who look for a fault.
struct RulesState {
  bool missing = false;               // there is no file
  std::string error;                  // why it cannot be used; empty: it can
  std::vector<std::string> warnings;  // about single rules
  bool grants = false;                // some rule grants the entitlement to somebody
};

// The file is an array of rules, each {"uid": n | "gid": n | "unit": text, "entitlements": {name: value}}; a
// rule with more than one of the three matches when all of them match, one with none never. A missing or
// unreadable file grants nothing; an unreadable or malformed one is one error line a change. For a shortage
// the last rules stand, and the file is read again at the next question.
class Entitlements {
 public:
  Entitlements(platform::FileStore& files, std::string path);
  // The first matching rule's value; only a boolean true is a grant, and that is the caller's to check.
  std::optional<Value> valueForEntitlement(std::string_view name, const Peer& peer);
  // How the file stands, and whether anybody is granted this. Nothing: it cannot be read just now.
  std::optional<RulesState> stateFor(std::string_view name);
  // False: no rule grants it to this user, whatever groups and unit a process of his has.
  bool mayHold(std::string_view name, unsigned uid);

 private:
  struct Said;
  void refresh(Said& said) REQUIRES(_mutex);
  void say(const Said& said);

  platform::FileStore& _files;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<std::uint64_t> _stamp GUARDED_BY(_mutex);
  bool _read GUARDED_BY(_mutex) = false;
  Array _rules GUARDED_BY(_mutex);
  RulesState _state GUARDED_BY(_mutex);  // of that reading, without `grants`
  platform::LimitedLine _shortages{"questions"};
};

// The decisions alone; exposed for their tables of tests.
bool anybodyIsGranted(const Array& rules, std::string_view name);
bool mayHoldByRules(const Array& rules, std::string_view name, unsigned uid);
std::optional<Value> entitlementInRules(const Array& rules, std::string_view name, const Peer& peer);

}  // namespace veltrad::ipc
