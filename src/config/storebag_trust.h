// SPDX-License-Identifier: Apache-2.0
// Verifies whether the bytes of a container are a storebag that this device may use. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "base/value.h"
#include "config/storebag_container.h"
#include "config/storebag_key.h"
#include "config/storebag_source.h"
#include "config/storebag_verdict.h"
#include "platform/limited_line.h"

namespace veltrad::platform {
class Clock;
class Counters;
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::support {
class Veltra;
}  // namespace veltrad::support

namespace veltrad::config {

class SeenStorebagsFile;

// The fingerprints of those keys whose Ed25519 signatures of the bag are in the container and good.
std::vector<std::string> ed25519SignersOf(const StorebagContainer& container, const std::string& bag,
                                          const std::vector<StorebagKey>& keys);

// Verifies with the current keys: publicKey.der, and those that the operator has chosen. Then applies the
// operator's rules, and records accepted storebags. The constructor's arguments must outlive it.
class StorebagTrust {
 public:
  StorebagTrust(const support::Veltra& veltra, platform::FileStore& files, SeenStorebagsFile& seen,
                const platform::Clock& clock, platform::Counters& counters, std::string keysDirectory);

  struct Refusal {
    StorebagCause cause;  // noAttempt: a key, or what was seen, is out of reach just now
    std::string why;
    std::optional<bool> genuine;              // as in StorebagAnswer
    std::optional<wire::Reason> reason = {};  // of cause `refused`
  };
  // The storebag in the container, which was asked for by `name`. A refusal has been logged and counted.
  Result<Dictionary, Refusal> accepted(const std::string& name, std::string_view container,
                                       const OperatorChoices& choices);
  // As in StorebagSource.
  std::optional<std::string> whyExpired(const std::optional<std::string>& expires) const;

 private:
  struct Keys {
    std::vector<StorebagKey> rsa;
    std::vector<StorebagKey> ed25519;
  };
  // Not empty of RSA keys.
  Result<Keys, Refusal> keys(const OperatorChoices& choices);
  std::optional<Refusal> addPublicKey(Keys& keys) const;
  std::optional<Refusal> addFurtherKey(const std::string& file, Keys& keys);
  Result<StorebagSigners, Refusal> signersOf(const StorebagContainer& container, const SignedStorebag& bag,
                                             const Keys& keys) const;
  Result<Dictionary, Refusal> judged(const std::string& name, const std::string& bag,
                                     const StorebagSigners& signers, const StorebagRules& rules);
  Failure<Refusal> refused(const std::string& name, StorebagRefusal refusal);
  double now() const;

  const support::Veltra& _veltra;
  platform::FileStore& _files;
  SeenStorebagsFile& _seen;
  const platform::Clock& _clock;
  platform::Counters& _counters;
  const std::string _keysDirectory;
  platform::LimitedLine _keyLines{"storebag keys"};
};

}  // namespace veltrad::config
