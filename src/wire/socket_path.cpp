// SPDX-License-Identifier: Apache-2.0
// Paths under the root directory.
#include "wire/socket_path.h"

#include <cstdlib>

namespace veltrad::wire {

std::string rootFromEnvironment() {
  const char* directory = std::getenv("VELTRA_ROOT");
  return directory && *directory ? directory : "/";
}

std::string pathUnder(std::string root, std::string_view relative) {
  while (!root.empty() && root.back() == '/') root.pop_back();
  root += '/';
  root += relative;
  return root;
}

std::string socketPathUnder(std::string root) {
  return pathUnder(std::move(root), "run/veltrad/com.florn.veltrad.sock");
}

std::string controlSocketPathUnder(std::string root) {
  return pathUnder(std::move(root), "run/veltrad/control.sock");
}

}  // namespace veltrad::wire
