// SPDX-License-Identifier: Apache-2.0
// UUIDs (RFC 4122, version 4) from the kernel's random bytes.
#include "platform/uuid.h"

#include <sys/random.h>

#include <cstdlib>

#include "base/text.h"

namespace veltrad::platform {

std::array<unsigned char, 16> randomUUID() {
  std::array<unsigned char, 16> bytes{};
  // So few bytes are never cut by a signal, and this cannot fail once the kernel's generator is ready.
  // OpenSSL's generator would take 8 million instructions at start, and can fail for lack of memory.
  if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) std::abort();
  bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0f) | 0x40);
  bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3f) | 0x80);
  return bytes;
}

std::string randomUUIDText() {
  const auto bytes = randomUUID();
  std::string text = hex({reinterpret_cast<const char*>(bytes.data()), bytes.size()}, kUpperCaseDigits);
  for (const std::size_t place : {8u, 13u, 18u, 23u}) text.insert(place, "-");
  return text;
}

}  // namespace veltrad::platform
