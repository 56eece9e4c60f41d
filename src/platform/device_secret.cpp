// SPDX-License-Identifier: Apache-2.0
// The secret is read or made once. Any thread.
#include "platform/device_secret.h"

#include <sys/random.h>

#include <cstdlib>
#include <string>

#include "platform/log.h"

namespace veltrad::platform {

namespace {

std::string randomBytes() {
  std::string bytes(DeviceSecret::kBytes, '\0');
  // So few bytes come whole.
  if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) std::abort();
  return bytes;
}

}  // namespace

std::optional<std::string> DeviceSecret::bytes() {
  std::string problem;
  std::string secret;
  {
    const Lock held(_mutex);
    if (_bytes) return _bytes;
    auto stored = _files.read(_path, 4'096);
    if (stored && stored.value().size() == kBytes) return _bytes = std::move(stored).value();
    if (stored) {
      problem =
          _path + ": " + std::to_string(stored.value().size()) + " bytes, expected " + std::to_string(kBytes);
    } else if (stored.error().passes()) {
      return std::nullopt;
    } else if (stored.error().kind != FileFailure::Kind::notFound) {
      problem = stored.error().description;
    }
    secret = randomBytes();
    if (problem.empty()) {
      const auto written = _files.replace(_path, secret);
      if (!written && written.error().passes()) return std::nullopt;
      if (!written) problem = written.error().description;
    }
    _bytes = secret;
  }
  if (!problem.empty())
    logWarning("The secret of this device cannot be kept, another one serves until the daemon ends: %s",
               problem.c_str());
  return secret;
}

Result<Done, FileFailure> DeviceSecret::renew() {
  std::string secret = randomBytes();
  const Lock held(_mutex);
  auto written = _files.replace(_path, secret);
  if (written) _bytes = std::move(secret);
  return written;
}

}  // namespace veltrad::platform
