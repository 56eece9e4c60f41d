// SPDX-License-Identifier: Apache-2.0
// Gathers the facts that `veltractl doctor` is answered from. The asking thread, which may wait for the
// storebag server.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/value.h"
#include "daemon/diagnosis.h"
#include "daemon/services.h"
#include "platform/sandbox.h"

namespace veltrad::config {
class ProcessSettings;
class StorebagSource;
}  // namespace veltrad::config

namespace veltrad::ipc {
class Connection;
}  // namespace veltrad::ipc

namespace veltrad::daemon {

class StorebagCache;

// Any thread. What the constructor takes outlives it.
class Doctor {
 public:
  Doctor(Services& services, config::ProcessSettings& settings, config::StorebagSource& source,
         platform::SandboxState sandbox);

  // Fetches the storebags of these client types, or without any those that sessions have asked for since the
  // start, else all; what it gets is used for nothing else, and the cache stays as it is. {"version", "pid",
  // "checks": [{"name", "result", "text", "mend"}]}
  Dictionary examine(ipc::Connection& caller, StorebagCache& cache, const std::vector<std::int32_t>& types);

 private:
  EntitlementFacts entitlementOf(ipc::Connection& caller);
  AddressFacts address();
  StorebagFacts storebags(StorebagCache& cache, const std::vector<std::int32_t>& types);
  Consent consent();
  MachineFacts machine();

  Services& _services;
  config::ProcessSettings& _settings;
  config::StorebagSource& _source;
  const platform::SandboxState _sandbox;
};

}  // namespace veltrad::daemon
