// SPDX-License-Identifier: Apache-2.0
// Reads etc/veltrad/policy.json again when it changed. Any thread.
#pragma once

#include <memory>
#include <string>

#include "base/mutex.h"
#include "config/policy.h"
#include "platform/local_settings.h"

namespace veltrad::config {

// A file that is broken or cannot be read closes everything, with one error line a change. A shortage is no
// change: what held goes on, and before the first reading everything is closed.
class OwnerPolicy {
 public:
  // `path`: of either form.
  OwnerPolicy(platform::FileStore& files, const std::string& path);

  // What holds now, never null. One object until that changes.
  std::shared_ptr<const Policy> current();
  // The same, with the file read now, whether it has changed or not.
  std::shared_ptr<const Policy> readAgain();

 private:
  struct Said;
  void refresh(Said& said) REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  platform::LocalSettings _file GUARDED_BY(_mutex);
  std::shared_ptr<const platform::LocalContent> _content GUARDED_BY(_mutex);  // null before the first reading
  std::shared_ptr<const Policy> _policy GUARDED_BY(_mutex) = Policy::closed();
};

}  // namespace veltrad::config
