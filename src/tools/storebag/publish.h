// SPDX-License-Identifier: Apache-2.0
// Publishes storebags into the served folder, and rolls back to earlier ones.
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
// Publishes all, or none if one of them fails the check of lint, key, name, date or serial. Each file is
// replaced as a whole, and is newer than the one before by its time of modification, by which daemons ask. A
// storebag that is served already is not changed.
Outcome publish(const PublishRequest& request);

struct RollbackRequest {
  std::vector<std::string> names;
  std::string directory;
  // Rolls back even to a storebag that devices can refuse.
  bool force = false;
};
// Serves the previous storebags again; the current ones are not kept. All, or none if devices would refuse
// one of them.
Outcome rollback(const RollbackRequest& request);

// Why a storebag with the serial `next` may not replace one with `served`; empty: it may. A device that
// has seen a serial can refuse a lower one, and one without.
std::string faultOfSerial(std::optional<std::int64_t> served, std::optional<std::int64_t> next);

}  // namespace veltrad::storebag
