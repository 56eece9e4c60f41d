// SPDX-License-Identifier: Apache-2.0
// Whether a storebag whose signature is good may be used. Plain functions; any thread.
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
  // They ask for what is remembered.
  bool remember() const { return revocation || rollback; }
};

// Fingerprints (64 hexadecimal digits) of the keys with a good signature of the bag.
struct StorebagSigners {
  std::string rsa;
  std::vector<std::string> ed25519;
};

// What has been seen of storebags that were accepted.
struct SeenStorebags {
  // The highest serial by storebag and by signer, so that what a key has set goes when it is revoked.
  std::map<std::string, std::map<std::string, std::int64_t>> serials;
  std::set<std::string> revoked;  // fingerprints

  bool operator==(const SeenStorebags&) const = default;
  // The highest serial of a storebag by signers that are not in `without`.
  std::optional<std::int64_t> highest(const std::string& name, const std::set<std::string>& without) const;
};

// What a bag says of itself.
struct StorebagClaims {
  std::optional<std::string> name;
  std::optional<std::int64_t> serial;
  std::optional<std::string> expires;  // as given
  std::vector<std::string> revoked;    // fingerprints
  // By key what is said in a form that cannot be read: "its "expires" is no date".
  std::map<std::string, std::string> unreadable;

  // Of a verified storebag. Digits of fingerprints may be capitals; here they are small.
  static StorebagClaims of(const Dictionary& storebag);
};

struct StorebagRefusal {
  wire::Reason reason;
  std::string text;  // "serial 4 is lower than 5"
};

// Decided before the bag is parsed: whether a key that may still sign vouches for it.
std::optional<StorebagRefusal> refusalOfSigners(const StorebagSigners& signers, const SeenStorebags& seen,
                                                const StorebagRules& rules);

// Decided on what the bag says. Its own revocations hold for it, too. `now`: seconds since 1970; a clock
// before this release is none, and nothing expires by it.
std::optional<StorebagRefusal> refusalOfClaims(const std::string& name, const StorebagClaims& claims,
                                               const StorebagSigners& signers, const SeenStorebags& seen,
                                               const StorebagRules& rules, double now);

// Why a bag with this "expires" may not be used now; nothing: it may.
std::optional<StorebagRefusal> refusalOfExpiry(const std::optional<std::string>& expires, double now);

// Takes an accepted bag into what was seen.
void remember(SeenStorebags& seen, const std::string& name, const StorebagClaims& claims,
              const StorebagSigners& signers, const StorebagRules& rules);

}  // namespace veltrad::config
