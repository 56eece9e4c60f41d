// SPDX-License-Identifier: Apache-2.0
// The rules, in the order in which they are applied.
#include "config/storebag_verdict.h"

#include <fmt/format.h>

#include <algorithm>

#include "base/text.h"
#include "base/version.h"
#include "config/expiry_date.h"
#include "config/operator_settings.h"
#include "config/storebag_content.h"
#include "config/storebag_key.h"

namespace veltrad::config {
namespace {

using wire::Reason;
using Refused = std::optional<StorebagRefusal>;

constexpr std::size_t kFingerprintDigits = 64;
// As many revocations are remembered. Each key that an operator ever had is one.
constexpr std::size_t kMostRevoked = 1'024;

bool isFingerprint(const std::string& text) {
  const auto isDigit = [](char c) { return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'f'); };
  return text.size() == kFingerprintDigits && std::all_of(text.begin(), text.end(), isDigit);
}

StorebagRefusal revokedKey(const std::string& fingerprint) {
  return {Reason::storebag_key_revoked,
          fmt::format("key {} is revoked", fingerprint.substr(0, StorebagKey::kShortFingerprint))};
}

Refused refusalBySigners(const StorebagSigners& signers, const std::set<std::string>& revoked,
                         const StorebagRules& rules) {
  if (rules.revocation && revoked.contains(signers.rsa)) return revokedKey(signers.rsa);
  if (!rules.ed25519) return std::nullopt;
  if (signers.ed25519.empty())
    return StorebagRefusal{Reason::storebag_no_ed25519, "it has no Ed25519 signature of a known key"};
  const auto stands = [&](const std::string& key) { return !rules.revocation || !revoked.contains(key); };
  if (std::none_of(signers.ed25519.begin(), signers.ed25519.end(), stands))
    return revokedKey(signers.ed25519.front());
  return std::nullopt;
}

// The key under which a serial is remembered: the strongest that vouches and is not revoked.
const std::string& signerOf(const StorebagSigners& signers, const std::set<std::string>& revoked) {
  for (const std::string& key : signers.ed25519) {
    if (!revoked.contains(key)) return key;
  }
  return signers.rsa;
}

std::set<std::string> revokedWith(const SeenStorebags& seen, const StorebagClaims& claims,
                                  const StorebagRules& rules) {
  if (!rules.revocation) return {};
  std::set<std::string> all = seen.revoked;
  all.insert(claims.revoked.begin(), claims.revoked.end());
  return all;
}

Refused refusalOfName(const std::string& name, const std::optional<std::string>& claimed) {
  if (claimed == name) return std::nullopt;
  return StorebagRefusal{Reason::storebag_wrong_name,
                         claimed ? fmt::format("its name is '{}'", *claimed) : "it has no name"};
}

Refused refusalOfSerial(const std::optional<std::int64_t>& serial,
                        const std::optional<std::int64_t>& highest) {
  if (!highest || (serial && *serial >= *highest)) return std::nullopt;
  return StorebagRefusal{Reason::storebag_rolled_back,
                         serial ? fmt::format("serial {} is lower than {}", *serial, *highest)
                                : fmt::format("it has no serial, the last one had {}", *highest)};
}

}  // namespace

StorebagRules StorebagRules::of(const OperatorChoices& choices) {
  const StorebagChoices& storebags = choices.storebags;
  return {!choices.keys.texts.empty(), storebags.ed25519, storebags.names, storebags.expiry,
          storebags.rollback};
}

std::optional<std::int64_t> SeenStorebags::highest(const std::string& name,
                                                   const std::set<std::string>& without) const {
  std::optional<std::int64_t> found;
  const auto of = serials.find(name);
  if (of == serials.end()) return found;
  for (const auto& [signer, serial] : of->second) {
    if (!without.contains(signer)) found = std::max(found.value_or(serial), serial);
  }
  return found;
}

StorebagClaims StorebagClaims::of(const Dictionary& storebag) {
  const auto parsed = config::parsed<Storebag>(storebag);
  StorebagClaims claims{parsed.name, parsed.serial, parsed.expires, {}, {}};
  const auto unreadable = [&](const char* key, const char* expected) {
    claims.unreadable.emplace(key, fmt::format("its \"{}\" is no {}", key, expected));
  };
  if (storebag.find("serial") && !claims.serial) unreadable("serial", "number");
  if (storebag.find("expires") && !(claims.expires && expiryOf(*claims.expires)))
    unreadable("expires", "date");
  const Array* revoked = storebag.array("revoked");
  if (storebag.find("revoked") && !revoked) unreadable("revoked", "array");
  for (const Value& value : revoked ? *revoked : Array()) {
    const std::string key = value.asString() ? lowerCase(*value.asString()) : "";
    if (!isFingerprint(key)) unreadable("revoked", "array of SHA-256 digests in 64 hexadecimal digits");
    claims.revoked.push_back(key);
  }
  return claims;
}

Refused refusalOfSigners(const StorebagSigners& signers, const SeenStorebags& seen,
                         const StorebagRules& rules) {
  return refusalBySigners(signers, seen.revoked, rules);
}

Refused refusalOfExpiry(const std::optional<std::string>& expires, double now) {
  const auto moment = expires ? expiryOf(*expires) : std::nullopt;
  if (!moment || now < kEarliestTime || now < *moment) return std::nullopt;
  return StorebagRefusal{Reason::storebag_expired, "expired on " + *expires};
}

Refused refusalOfClaims(const std::string& name, const StorebagClaims& claims, const StorebagSigners& signers,
                        const SeenStorebags& seen, const StorebagRules& rules, double now) {
  for (const auto& [rule, key] : {std::pair(rules.rollback, "serial"), std::pair(rules.expiry, "expires"),
                                  std::pair(rules.revocation, "revoked")}) {
    const auto said = claims.unreadable.find(key);
    if (rule && said != claims.unreadable.end())
      return StorebagRefusal{Reason::storebag_claims_unreadable, said->second};
  }
  const std::set<std::string> revoked = revokedWith(seen, claims, rules);
  if (auto refusal = refusalBySigners(signers, revoked, rules)) return refusal;
  if (revoked.size() > kMostRevoked)
    return StorebagRefusal{Reason::storebag_claims_unreadable,
                           fmt::format("more than {} keys would be revoked", kMostRevoked)};
  if (rules.names) {
    if (auto refusal = refusalOfName(name, claims.name)) return refusal;
  }
  if (rules.expiry) {
    if (auto refusal = refusalOfExpiry(claims.expires, now)) return refusal;
  }
  return rules.rollback ? refusalOfSerial(claims.serial, seen.highest(name, revoked)) : std::nullopt;
}

void remember(SeenStorebags& seen, const std::string& name, const StorebagClaims& claims,
              const StorebagSigners& signers, const StorebagRules& rules) {
  if (rules.revocation) {
    seen.revoked.insert(claims.revoked.begin(), claims.revoked.end());
    for (auto& [storebag, bySigner] : seen.serials)
      std::erase_if(bySigner, [&](const auto& entry) { return seen.revoked.contains(entry.first); });
  }
  if (!rules.rollback || !claims.serial) return;
  std::int64_t& serial = seen.serials[name][signerOf(signers, seen.revoked)];
  serial = std::max(serial, *claims.serial);
}

}  // namespace veltrad::config
