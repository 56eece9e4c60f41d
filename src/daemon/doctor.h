// SPDX-License-Identifier: Apache-2.0
// Collects the facts for `veltractl doctor`. Runs on the caller's thread, which may wait for the storebag
// server.
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

// Any thread. The constructor's arguments must outlive it.
class Doctor {
 public:
  Doctor(Services& services, config::ProcessSettings& settings, config::StorebagSource& source,
         platform::SandboxState sandbox);

  // Fetches the storebags of these client types; without any, those that sessions have asked for since the
  // start, or all. The storebags are not used otherwise, and the cache does not change. {"version", "pid",
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
