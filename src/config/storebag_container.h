// SPDX-License-Identifier: Apache-2.0
// Reads, from untrusted bytes, the signed container of a storebag: its texts, the signed bytes, and the
// storebag.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/property_list.h"
#include "base/result.h"
#include "base/value.h"

namespace veltrad::config {

// The container is parsed before it is trusted. Its limits keep any bytes within 100 ms of CPU time and 16
// MiB of memory, and leave room for a few more keys.
inline constexpr std::size_t kStorebagMostContainerBytes = 2u << 20;
inline constexpr PropertyListLimits kStorebagContainerLimits{.bytes = kStorebagMostContainerBytes,
                                                             .depth = 8,
                                                             .objects = 1'000,
                                                             .textBytes = kStorebagMostContainerBytes};
// The bag is parsed only if its signature is valid. Its limits protect against mistakes when it was made.
inline constexpr PropertyListLimits kStorebagBagLimits{.bytes = kStorebagMostContainerBytes,
                                                       .depth = 32,
                                                       .objects = 65'536,
                                                       .textBytes = kStorebagMostContainerBytes};

// One more signature over the decoded bag: {"key", "ed25519"}.
struct FurtherSignature {
  std::string key;      // the first 16 digits of the key's fingerprint
  std::string ed25519;  // in base64
};
// As many are read; further ones are not looked at, because each costs a digest of the whole bag.
inline constexpr std::size_t kMostFurtherSignatures = 16;

// The texts of the container, in base64: the signature over the decoded bag, and the bag, a property list.
struct StorebagContainer {
  std::optional<std::string> signature;
  std::optional<std::string> bag;
  std::vector<FurtherSignature> signatures = {};  // what "signatures" holds of that form
};

// A property list that is not a dictionary gives an empty container.
Result<StorebagContainer, PropertyListError> parseStorebagContainer(std::string_view bytes);

struct SignedStorebag {
  std::string signature;
  std::string bag;
};

// Absent if either text is absent or not base64; characters outside the alphabet are skipped.
std::optional<SignedStorebag> decodeStorebagContainer(const StorebagContainer& container);

// The storebag in a bag that was verified; absent if it is not a dictionary within the limits.
std::optional<Dictionary> parseStorebagBag(std::string_view bag);

}  // namespace veltrad::config
