// Where the system's fixed paths begin. Any thread.
#include "platform/root.h"

#include <cstdlib>

namespace veltrad::platform {

Root::Root(std::string directory) : _directory(std::move(directory)) {
  while (_directory.size() > 1 && _directory.back() == '/') _directory.pop_back();
  if (_directory.empty()) _directory = "/";
}

Root Root::fromEnvironment() {
  const char* directory = std::getenv("VELTRA_ROOT");
  return Root(directory && *directory ? directory : "/");
}

std::string Root::path(std::string_view relative) const {
  std::string path = _directory;
  if (path.back() != '/') path += '/';
  path += relative;
  return path;
}

}  // namespace veltrad::platform
