// SPDX-License-Identifier: Apache-2.0
// The secret of this device, which never leaves it. Any thread.
#pragma once

#include <optional>
#include <string>

#include "base/mutex.h"
#include "base/result.h"
#include "platform/file_store.h"

namespace veltrad::platform {

// 32 random bytes in a file of mode 0600, made at the first use. If the file cannot be written, or has
// another size, one warning is logged, and the secret lasts only as long as this object.
class DeviceSecret {
 public:
  static constexpr std::size_t kBytes = 32;

  // The store must outlive it.
  DeviceSecret(FileStore& files, std::string path) : _files(files), _path(std::move(path)) {}

  // Nothing: because of a shortage nobody can say what is stored, so nothing was made.
  std::optional<std::string> bytes();
  // Makes and stores another secret. If that fails, the one before stays.
  Result<Done, FileFailure> renew();

 private:
  FileStore& _files;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<std::string> _bytes GUARDED_BY(_mutex);
};

}  // namespace veltrad::platform
