// UUIDs by RFC 4122, version 4, from OpenSSL's generator. Any thread.
#include "platform/uuid.h"

#include <openssl/rand.h>

#include <cstdlib>

namespace veltrad::platform {

std::array<unsigned char, 16> randomUUID() {
  std::array<unsigned char, 16> bytes{};
  if (RAND_bytes(bytes.data(), static_cast<int>(bytes.size())) != 1) std::abort();
  bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0f) | 0x40);
  bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3f) | 0x80);
  return bytes;
}

std::string randomUUIDText() {
  static constexpr char kDigits[] = "0123456789ABCDEF";
  const auto bytes = randomUUID();
  std::string text;
  text.reserve(36);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += kDigits[bytes[i] >> 4];
    text += kDigits[bytes[i] & 0x0f];
  }
  return text;
}

}  // namespace veltrad::platform
