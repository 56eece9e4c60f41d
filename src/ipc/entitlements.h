// Entitlements of peers by etc/veltrad/entitlements.plist, which is read again when it changes. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "ipc/peer.h"
#include "platform/limited_line.h"

namespace veltrad::platform {
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::ipc {

// The file is an array of rules, {"uid": n | "gid": n | "unit": text, "entitlements": {name: value}}. A rule
// matches if all of its conditions match and there is at least one. A missing, unreadable or malformed file
// grants nothing; the latter two are one error line for each change. During a shortage the last rules apply.
class Entitlements {
 public:
  Entitlements(platform::FileStore& files, std::string path);
  // The value in the first rule that matches and names the entitlement. The caller checks that it is true.
  std::optional<Value> valueForEntitlement(std::string_view name, const Peer& peer);
  // False if no rule can grant it to this user, whatever the groups and the unit of the process.
  bool mayHold(std::string_view name, unsigned uid);

 private:
  struct Said;
  Array readRules(Said& said);
  void refresh(Said& said) REQUIRES(_mutex);
  void say(const Said& said);

  platform::FileStore& _files;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<std::uint64_t> _stamp GUARDED_BY(_mutex);
  bool _read GUARDED_BY(_mutex) = false;
  Array _rules GUARDED_BY(_mutex);
  platform::LimitedLine _shortages{"questions"};
};

// The decisions, exposed for tests.
bool mayHoldByRules(const Array& rules, std::string_view name, unsigned uid);
std::optional<Value> entitlementInRules(const Array& rules, std::string_view name, const Peer& peer);

}  // namespace veltrad::ipc
