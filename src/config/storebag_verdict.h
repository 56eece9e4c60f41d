// SPDX-License-Identifier: Apache-2.0
// Decides whether a storebag with a good signature may be used. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "base/value.h"
#include "wire/reasons.h"

namespace veltrad::config {

struct OperatorChoices;

// Which of the rules the operator has chosen.
struct StorebagRules {
  bool revocation = false;  // there are further keys
  bool ed25519 = false;
  bool names = false;
  bool expiry = false;
  bool rollback = false;

  static StorebagRules of(const OperatorChoices& choices);
  bool any() const { return revocation || ed25519 || names || expiry || rollback; }
  // True if a rule needs the record of seen storebags.
  bool remember() const { return revocation || rollback; }
};

// Fingerprints (64 hexadecimal digits) of the keys with a good signature of the bag.
struct StorebagSigners {
  std::string rsa;
  std::vector<std::string> ed25519;
};

// The record of accepted storebags.
struct SeenStorebags {
  // The highest serial by storebag and by signer, so that revoking a key also removes the serials that it has
  // set.
  std::map<std::string, std::map<std::string, std::int64_t>> serials;
  std::set<std::string> revoked;  // fingerprints

  bool operator==(const SeenStorebags&) const = default;
  // The highest serial of a storebag by signers that are not in `without`.
  std::optional<std::int64_t> highest(const std::string& name, const std::set<std::string>& without) const;
};

// The claims of a bag: serial, date, name and revocations.
struct StorebagClaims {
  std::optional<std::string> name;
  std::optional<std::int64_t> serial;
  std::optional<std::string> expires;  // as given
  std::vector<std::string> revoked;    // fingerprints
  // Claims that cannot be read, by key: "its "expires" is no date".
  std::map<std::string, std::string> unreadable;

  // Reads the claims of a verified storebag. Fingerprints are converted to lower case.
  static StorebagClaims of(const Dictionary& storebag);
};

struct StorebagRefusal {
  wire::Reason reason;
  std::string text;  // "serial 4 is lower than 5"
};

// Decided before the bag is parsed: whether a key that is not revoked has signed it.
std::optional<StorebagRefusal> refusalOfSigners(const StorebagSigners& signers, const SeenStorebags& seen,
                                                const StorebagRules& rules);

// Decided by the claims of the bag. Its own revocations apply to it, too. `now`: seconds since 1970; if the
// clock shows a time before this release, nothing expires.
std::optional<StorebagRefusal> refusalOfClaims(const std::string& name, const StorebagClaims& claims,
                                               const StorebagSigners& signers, const SeenStorebags& seen,
                                               const StorebagRules& rules, double now);

// Why a bag with this "expires" may not be used now; absent if it may.
std::optional<StorebagRefusal> refusalOfExpiry(const std::optional<std::string>& expires, double now);

// Adds an accepted bag to the record.
void remember(SeenStorebags& seen, const std::string& name, const StorebagClaims& claims,
              const StorebagSigners& signers, const StorebagRules& rules);

}  // namespace veltrad::config
