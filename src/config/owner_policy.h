// SPDX-License-Identifier: Apache-2.0
// Reads etc/veltrad/policy.json again when it changed. Any thread.
#pragma once

#include <string>

#include "config/policy.h"
#include "config/settings_follower.h"

namespace veltrad::config {

// A file that is broken or cannot be read closes everything, with one error line a change. Everything is
// closed before the first reading, too. What holds is never null.
class OwnerPolicy final : public SettingsFollower<Policy> {
 public:
  // `path`: of either form.
  OwnerPolicy(platform::FileStore& files, const std::string& path);
};

}  // namespace veltrad::config
