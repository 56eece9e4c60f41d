// SPDX-License-Identifier: Apache-2.0
// Puts storebags into the folder that is served, and goes back to those that were served before.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "storebag/commands.h"

namespace veltrad::storebag {

struct PublishRequest {
  // Signed containers; the name of each is that of its storebag.
  std::vector<std::string> files;
  std::string directory;
  std::string publicKey = "keys/publicKey.der";
  // As for verify().
  std::string ed25519 = {};
};
// Publishes all or, if lint, a key, a name, a date or a serial says no to one of them, none. Each file is
// replaced as a whole, and is newer than the one before by its time of modification, by which daemons ask.
// What is served already stays as it is.
Outcome publish(const PublishRequest& request);

struct RollbackRequest {
  std::vector<std::string> names;
  std::string directory;
  // Also to one that devices can refuse.
  bool force = false;
};
// Puts the storebags back that were served before; what is served now is not kept. All or, if devices would
// refuse one of them, none.
Outcome rollback(const RollbackRequest& request);

// Why a storebag with the serial `next` may not replace one with `served`; empty: it may. A device that
// has seen a serial can refuse a lower one, and one without.
std::string faultOfSerial(std::optional<std::int64_t> served, std::optional<std::int64_t> next);

}  // namespace veltrad::storebag
