// SPDX-License-Identifier: Apache-2.0
// What a storebag server sends: whatever the bytes are, the one bag that was ever signed is the only one that
// verifies.
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>

#include "config/expiry_date.h"
#include "config/seen_storebags_file.h"
#include "config/storebag_container.h"
#include "config/storebag_content.h"
#include "config/storebag_download.h"
#include "config/storebag_key.h"
#include "config/storebag_trust.h"
#include "config/storebag_verdict.h"

static std::string contentOf(const char* path) {
  std::ifstream file(std::string(VELTRA_FUZZ_DIRECTORY) + path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace veltrad;
  // The other half of this key is gone; the corpus holds the one bag that it signed.
  static const auto key = config::StorebagKey::fromDER(contentOf("/storebag_key.der")).value();
  static const auto second = config::StorebagKey::fromFile(contentOf("/storebag_second_key.der")).value();
  static const std::string signedBag = contentOf("/corpus/storebag_container/bare_bag");
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);

  if (const auto container = config::parseStorebagContainer(bytes)) {
    const auto decoded = config::decodeStorebagContainer(container.value());
    if (decoded && key.verifies(decoded->bag, decoded->signature) && decoded->bag != signedBag) std::abort();
    if (container.value().signatures.size() > config::kMostFurtherSignatures) std::abort();
    if (decoded && !config::ed25519SignersOf(container.value(), decoded->bag, {second}).empty() &&
        decoded->bag != signedBag)
      std::abort();
  }
  // What only a signed bag reaches, and what only a header does.
  if (const auto bag = config::parseStorebagBag(bytes)) {
    const auto storebag = config::parsed<config::Storebag>(*bag);
    config::parseSection(storebag.release.value_or(*bag));
    const auto claims = config::StorebagClaims::of(*bag);
    config::refusalOfClaims("quindle", claims, {}, {}, {true, true, true, true, true}, 1e9);
  }
  config::expiryOf(bytes);
  // What the operator's keys and the daemon's own file hold.
  config::StorebagKey::fromFile(bytes);
  if (const auto seen = config::seenStorebagsIn(bytes)) {
    if (config::seenStorebagsIn(config::textOf(*seen)) != seen) std::abort();
  }
  config::maxAgeOfCacheControl(bytes);
  return 0;
}
