// SPDX-License-Identifier: Apache-2.0
// The folder from which a web server serves storebags: one file for each name, and below ".before" those that
// were published before.
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
};
// Publishes all or, if lint, the key, a name or a serial says no to one of them, none. Each file is replaced
// as a whole, and is newer than the one before by its time of modification, by which daemons ask.
Outcome publish(const PublishRequest& request);
// Puts the storebag back that was published before; what is served now is not kept.
Outcome rollback(const std::vector<std::string>& names, const std::string& directory);

// Why a storebag with the serial `next` may not replace one with `served`; empty: it may. A device that
// has seen a serial can refuse a lower one, and one without.
std::string faultOfSerial(std::optional<std::int64_t> served, std::optional<std::int64_t> next);

}  // namespace veltrad::storebag
