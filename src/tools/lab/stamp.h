// SPDX-License-Identifier: Apache-2.0
// The changes that the lab makes to a served storebag, and the keys that sign it: the "bag" of a rule.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::lab {

class Directory;

// The name of the keys in DIR/signing itself; any other NAME is for those in DIR/signing/NAME.
inline constexpr const char* kOwnKeys = "signing";

// The keys of "bag" (see `veltra-lab --help`). A default changes nothing.
struct Stamp {
  std::optional<std::int64_t> serial;
  std::optional<std::string> expires;
  // "expires" is so many seconds after the clock.
  std::optional<std::int64_t> validFor;
  // A date and time that the lab takes for now; absent: the machine's.
  std::optional<std::string> clock;
  std::optional<std::string> name;
  // Names of keys, both of which are revoked, or fingerprints.
  std::optional<std::vector<std::string>> revoked;
  // The name of the RSA key that signs.
  std::string key = kOwnKeys;
  // The names of the Ed25519 keys that also sign.
  std::vector<std::string> ed25519{kOwnKeys};
};

// The error is what was expected.
Result<Stamp, std::string> stampFrom(const Value& value);

// The container of the stamped storebag. The error is one line that names the key that cannot be had.
Result<std::string, std::string> stampedContainer(const Dictionary& storebag, const Stamp& stamp,
                                                  const Directory& directory);

}  // namespace veltrad::lab
