// SPDX-License-Identifier: Apache-2.0
// etc/veltrad/policy.json, read again after each change. Any thread.
#pragma once

#include <string>

#include "config/policy.h"
#include "config/settings_follower.h"

namespace veltrad::config {

// With a broken or unreadable file nothing may leave, and one error is logged for each change. The same
// applies before the first reading. current() is never null.
class OwnerPolicy final : public SettingsFollower<Policy> {
 public:
  // `path`: of either form.
  OwnerPolicy(platform::FileStore& files, const std::string& path);
};

}  // namespace veltrad::config
