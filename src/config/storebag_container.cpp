// SPDX-License-Identifier: Apache-2.0
// Reads a storebag container and the storebag in it.
#include "config/storebag_container.h"

#include "base/base64.h"
#include "formats/property_list.h"

namespace veltrad::config {
namespace {

std::optional<std::string> textUnder(const Dictionary& dictionary, std::string_view key) {
  const std::string* text = dictionary.string(key);
  return text != nullptr ? std::optional(*text) : std::nullopt;
}

std::vector<FurtherSignature> signaturesIn(const Dictionary& container) {
  std::vector<FurtherSignature> found;
  const Array* array = container.array("signatures");
  for (std::size_t i = 0; array && i < array->size() && i < kMostFurtherSignatures; ++i) {
    const Dictionary* one = (*array)[i].asDictionary();
    const std::string* key = one ? one->string("key") : nullptr;
    const std::string* signature = one ? one->string("ed25519") : nullptr;
    if (key && signature) found.push_back({*key, *signature});
  }
  return found;
}

}  // namespace

Result<StorebagContainer, PropertyListError> parseStorebagContainer(std::string_view bytes) {
  const auto list = formats::parsePropertyList(bytes, kStorebagContainerLimits);
  if (!list) return Failure{list.error()};
  const Dictionary* dictionary = list.value().asDictionary();
  if (dictionary == nullptr) return StorebagContainer{};
  return StorebagContainer{textUnder(*dictionary, "signature"), textUnder(*dictionary, "bag"),
                           signaturesIn(*dictionary)};
}

std::optional<SignedStorebag> decodeStorebagContainer(const StorebagContainer& container) {
  if (!container.signature || !container.bag) return std::nullopt;
  std::optional<std::string> signature = decodeBase64(*container.signature);
  if (!signature) return std::nullopt;
  std::optional<std::string> bag = decodeBase64(*container.bag);
  if (!bag) return std::nullopt;
  return SignedStorebag{std::move(*signature), std::move(*bag)};
}

std::optional<Dictionary> parseStorebagBag(std::string_view bag) {
  const auto list = formats::parsePropertyList(bag, kStorebagBagLimits);
  const Dictionary* dictionary = list ? list.value().asDictionary() : nullptr;
  return dictionary != nullptr ? std::optional(*dictionary) : std::nullopt;
}

}  // namespace veltrad::config
