// SPDX-License-Identifier: Apache-2.0
// The root directory, normalised.
#include "platform/root.h"

namespace veltrad::platform {

Root::Root(std::string directory) : _directory(std::move(directory)) {
  while (_directory.size() > 1 && _directory.back() == '/') _directory.pop_back();
  if (_directory.empty()) _directory = "/";
}

}  // namespace veltrad::platform
