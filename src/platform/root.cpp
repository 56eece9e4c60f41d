// Where the system's fixed paths begin. Any thread.
#include "platform/root.h"

#include "wire/socket_path.h"

namespace veltrad::platform {

Root::Root(std::string directory) : _directory(std::move(directory)) {
  while (_directory.size() > 1 && _directory.back() == '/') _directory.pop_back();
  if (_directory.empty()) _directory = "/";
}

Root Root::fromEnvironment() {
  return Root(wire::rootFromEnvironment());
}

std::string Root::path(std::string_view relative) const {
  return wire::pathUnder(_directory, relative);
}

std::string Root::socketPath() const {
  return wire::socketPathUnder(_directory);
}

std::string Root::controlSocketPath() const {
  return wire::controlSocketPathUnder(_directory);
}

}  // namespace veltrad::platform
