// SPDX-License-Identifier: Apache-2.0
// Which content of policy.json holds. Any thread.
#include "config/owner_policy.h"

#include <optional>
#include <utility>

#include "platform/log.h"

namespace veltrad::config {

// Logged once the lock is released.
struct OwnerPolicy::Said {
  std::string error;
  std::optional<std::string> warning;

  void log() const {
    if (warning) logWarning("Policy: %s", warning->c_str());
    if (!error.empty()) logError("Policy could not be read, nothing leaves: %s", error.c_str());
  }
};

OwnerPolicy::OwnerPolicy(platform::FileStore& files, const std::string& path) : _file(files, path) {}

std::shared_ptr<const Policy> OwnerPolicy::current() {
  Said said;
  std::shared_ptr<const Policy> now;
  {
    const Lock held(_mutex);
    refresh(said);
    now = _policy;
  }
  said.log();
  return now;
}

std::shared_ptr<const Policy> OwnerPolicy::readAgain() {
  {
    const Lock held(_mutex);
    _file.readAgain();
  }
  return current();
}

void OwnerPolicy::refresh(Said& said) {
  using Kind = platform::LocalContent::Kind;
  auto now = _file.content();
  if (!now || now.value() == _content) return;
  _content = std::move(now).value();
  said.warning = _content->warning;
  switch (_content->kind) {
    case Kind::absent:
      _policy = std::make_shared<const Policy>();
      return;
    case Kind::broken:
      said.error = _content->error;
      _policy = nullptr;
      break;
    case Kind::good:
      _policy = Policy::of(*_content, said.error);
      break;
  }
  if (!_policy) _policy = Policy::closed();
}

}  // namespace veltrad::config
