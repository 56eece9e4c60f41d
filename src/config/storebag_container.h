// The signed container that a storebag arrives in: from bytes to the texts in it, to the bytes that are
// signed, to the storebag. Pure functions over bytes that nobody vouches for; any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "base/property_list.h"
#include "base/result.h"
#include "base/value.h"

namespace veltrad::config {

// Storebags are some kilobytes. The container is parsed before it is trusted, so its bounds keep whatever
// bytes a server sends within 100 ms of CPU and 16 MiB of memory; it needs two texts and has room for a few
// keys more.
inline constexpr std::size_t kStorebagMostContainerBytes = 2u << 20;
inline constexpr PropertyListLimits kStorebagContainerLimits{.bytes = kStorebagMostContainerBytes,
                                                             .depth = 8,
                                                             .objects = 1'000,
                                                             .textBytes = kStorebagMostContainerBytes};
// The bag is parsed only when its signature holds; its bounds keep a mistake at the signing desk within the
// same.
inline constexpr PropertyListLimits kStorebagBagLimits{.bytes = kStorebagMostContainerBytes,
                                                       .depth = 32,
                                                       .objects = 65'536,
                                                       .textBytes = kStorebagMostContainerBytes};

// The texts of the container; one that is missing or no text is absent.
struct StorebagContainer {
  std::optional<std::string> signature;  // base64 of the signature over the decoded bag
  std::optional<std::string> bag;        // base64 of the storebag, itself a property list
};

// A property list that is no dictionary is a container with nothing in it.
Result<StorebagContainer, PropertyListError> parseStorebagContainer(std::string_view bytes);

struct SignedStorebag {
  std::string signature;
  std::string bag;
};

// Nothing when either text is absent or no base64; characters outside the alphabet are skipped.
std::optional<SignedStorebag> decodeStorebagContainer(const StorebagContainer& container);

// The storebag in bag bytes that have been verified; nothing when they are no dictionary within the bounds.
std::optional<Dictionary> parseStorebagBag(std::string_view bag);

}  // namespace veltrad::config
