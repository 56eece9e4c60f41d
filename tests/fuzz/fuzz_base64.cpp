// SPDX-License-Identifier: Apache-2.0
// Base64 from anyone: what decodes is encoded and decoded again as the same bytes; every input encodes and
// decodes.
#include <cstdint>
#include <cstdlib>

#include "base/base64.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const std::string_view input(reinterpret_cast<const char*>(bytes), size);
  if (decodeBase64(encodeBase64(input)) != input) std::abort();
  const auto decoded = decodeBase64(input);
  if (decoded && decodeBase64(encodeBase64(*decoded)) != decoded) std::abort();
  return 0;
}
