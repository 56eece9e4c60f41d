// SPDX-License-Identifier: Apache-2.0
// Verifies a container, step by step, and applies the rules.
#include "config/storebag_trust.h"

#include <fmt/format.h>

#include <utility>

#include "base/base64.h"
#include "config/operator_settings.h"
#include "config/seen_storebags_file.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "support/veltra.h"

namespace veltrad::config {
namespace {

using Cause = StorebagCause;

constexpr std::size_t kMostKeyBytes = 1u << 16;

bool isFileName(const std::string& text) {
  return !text.empty() && text != "." && text != ".." && text.find('/') == std::string::npos &&
         text.find('\0') == std::string::npos;
}

std::string fingerprintsOf(const std::vector<StorebagKey>& keys) {
  std::string text;
  for (const StorebagKey& key : keys) text += (text.empty() ? "" : ", ") + key.fingerprint();
  return text;
}

}  // namespace

std::vector<std::string> ed25519SignersOf(const StorebagContainer& container, const std::string& bag,
                                          const std::vector<StorebagKey>& keys) {
  std::vector<std::string> signers;
  for (const StorebagKey& key : keys) {
    std::string fingerprint = key.fingerprint();
    for (const FurtherSignature& one : container.signatures) {
      if (fingerprint.compare(0, StorebagKey::kShortFingerprint, one.key) != 0) continue;
      const auto signature = decodeBase64(one.ed25519);
      if (!signature || !key.verifies(bag, *signature)) continue;
      signers.push_back(std::move(fingerprint));
      break;
    }
  }
  return signers;
}

StorebagTrust::StorebagTrust(const support::Veltra& veltra, platform::FileStore& files,
                             SeenStorebagsFile& seen, const platform::Clock& clock,
                             platform::Counters& counters, std::string keysDirectory)
    : _veltra(veltra),
      _files(files),
      _seen(seen),
      _clock(clock),
      _counters(counters),
      _keysDirectory(std::move(keysDirectory)) {}

Result<Dictionary, StorebagTrust::Refusal> StorebagTrust::accepted(const std::string& name,
                                                                   std::string_view body,
                                                                   const OperatorChoices& choices) {
  const auto container = parseStorebagContainer(body);
  if (!container) {
    const std::string& why = container.error().description();
    logError("fetchStorebagWithName: propertyListWithData error %s", why.c_str());
    logError("fetchStorebagWithName: Signature is missing");
    return Failure{Refusal{Cause::noStorebag, "the answer is no property list: " + why, {}}};
  }
  if (!container.value().signature) {
    logError("fetchStorebagWithName: Signature is missing");
    return Failure{Refusal{Cause::signature, "the answer is not signed: it has no \"signature\"", false}};
  }
  const auto keys = this->keys(choices);
  if (!keys) return Failure{keys.error()};
  const std::optional<SignedStorebag> decoded = decodeStorebagContainer(container.value());
  if (!decoded) {
    return Failure{Refusal{Cause::signature, "\"signature\" or \"bag\" of the answer is no base64", false}};
  }
  const auto signers = signersOf(container.value(), *decoded, keys.value());
  if (!signers) return Failure{signers.error()};
  return judged(name, decoded->bag, signers.value(), StorebagRules::of(choices));
}

Result<StorebagTrust::Keys, StorebagTrust::Refusal> StorebagTrust::keys(const OperatorChoices& choices) {
  Keys keys;
  for (std::size_t i = 0; i < choices.keys.texts.size() && i < kMostFurtherKeys; ++i) {
    if (auto shortage = addFurtherKey(choices.keys.texts[i], keys)) return Failure{std::move(*shortage)};
  }
  const auto without = addPublicKey(keys);
  if (without && (keys.rsa.empty() || without->cause == Cause::noAttempt)) return Failure{*without};
  return keys;
}

std::optional<StorebagTrust::Refusal> StorebagTrust::addPublicKey(Keys& keys) const {
  const auto der = _veltra.publicKeyDER();
  if (!der) {
    const Cause cause = der.error().passes() ? Cause::noAttempt : Cause::publicKey;
    return Refusal{cause, der.error().description, {}};
  }
  auto key = StorebagKey::fromDER(der.value());
  if (!key) {
    return Refusal{
        Cause::publicKey,
        fmt::format("{} is no RSA public key in DER form of {} to {} bits", _veltra.publicKeyPath(),
                    StorebagKey::kFewestModulusBits, StorebagKey::kMostModulusBits),
        {}};
  }
  keys.rsa.insert(keys.rsa.begin(), std::move(*key));
  return std::nullopt;
}

// Returns a shortage. A file that is no key is one line.
std::optional<StorebagTrust::Refusal> StorebagTrust::addFurtherKey(const std::string& file, Keys& keys) {
  const std::string path = _keysDirectory + "/" + file;
  const auto unused = [&](const std::string& why) {
    if (const auto line = _keyLines.happened("Storebag key not used: " + why)) logError("%s", line->c_str());
    return std::nullopt;
  };
  if (!isFileName(file))
    return unused(fmt::format("\"{}\" is no name of a file in {}", file, _keysDirectory));
  const auto bytes = _files.read(path, kMostKeyBytes);
  if (!bytes && bytes.error().passes()) return Refusal{Cause::noAttempt, bytes.error().description, {}};
  if (!bytes) return unused(bytes.error().description);
  auto key = StorebagKey::fromFile(bytes.value());
  if (!key)
    return unused(path + ": no RSA public key of 2048 to 8192 bits and no Ed25519 one, in DER or PEM");
  (key->kind() == StorebagKey::Kind::rsa ? keys.rsa : keys.ed25519).push_back(std::move(*key));
  return std::nullopt;
}

Result<StorebagSigners, StorebagTrust::Refusal> StorebagTrust::signersOf(const StorebagContainer& container,
                                                                         const SignedStorebag& bag,
                                                                         const Keys& keys) const {
  for (const StorebagKey& key : keys.rsa) {
    if (key.verifies(bag.bag, bag.signature))
      return StorebagSigners{key.fingerprint(), ed25519SignersOf(container, bag.bag, keys.ed25519)};
  }
  logError("fetchStorebagWithName: Signature can not be verified, %p", keys.rsa.front().identity());
  const std::string why =
      keys.rsa.size() == 1 ? fmt::format("the signature is not by the key in {} (SHA-256 {})",
                                         _veltra.publicKeyPath(), keys.rsa.front().fingerprint())
                           : fmt::format("the signature is by none of the keys in {} and {} (SHA-256 {})",
                                         _veltra.publicKeyPath(), _keysDirectory, fingerprintsOf(keys.rsa));
  return Failure{Refusal{Cause::signature, why, false}};
}

Result<Dictionary, StorebagTrust::Refusal> StorebagTrust::judged(const std::string& name,
                                                                 const std::string& bag,
                                                                 const StorebagSigners& signers,
                                                                 const StorebagRules& rules) {
  SeenStorebags seen;
  if (rules.remember()) {
    auto remembered = _seen.seen();
    if (!remembered && remembered.error().passes)
      return Failure{Refusal{Cause::noAttempt, remembered.error().description, {}}};
    if (!remembered)
      return refused(name,
                     {wire::Reason::storebag_seen_unreadable,
                      "what was seen of earlier ones cannot be read: " + remembered.error().description});
    seen = std::move(remembered).value();
  }
  if (auto refusal = refusalOfSigners(signers, seen, rules)) return refused(name, std::move(*refusal));
  auto storebag = parseStorebagBag(bag);
  if (!storebag) return Failure{Refusal{Cause::content, "the signed \"bag\" is no property list", true}};
  if (!rules.any()) return std::move(*storebag);
  const StorebagClaims claims = StorebagClaims::of(*storebag);
  if (auto refusal = refusalOfClaims(name, claims, signers, seen, rules, now()))
    return refused(name, std::move(*refusal));
  if (rules.remember()) _seen.remember(name, claims, signers, rules);
  return std::move(*storebag);
}

Failure<StorebagTrust::Refusal> StorebagTrust::refused(const std::string& name, StorebagRefusal refusal) {
  _counters.count(refusal.reason);
  logError("Storebag '%s' refused: %s", name.c_str(), refusal.text.c_str());
  const bool genuine = refusal.reason != wire::Reason::storebag_key_revoked &&
                       refusal.reason != wire::Reason::storebag_no_ed25519;
  return Failure{Refusal{Cause::refused, std::move(refusal.text), genuine, refusal.reason}};
}

std::optional<std::string> StorebagTrust::whyExpired(const std::optional<std::string>& expires) const {
  auto refusal = refusalOfExpiry(expires, now());
  return refusal ? std::optional(std::move(refusal->text)) : std::nullopt;
}

double StorebagTrust::now() const {
  return platform::timevalToSeconds(_clock.now());
}

}  // namespace veltrad::config
