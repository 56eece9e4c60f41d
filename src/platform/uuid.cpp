// UUIDs by RFC 4122, version 4, from the kernel's generator. Any thread.
#include "platform/uuid.h"

#include <sys/random.h>

#include <cstdlib>

namespace veltrad::platform {

std::array<unsigned char, 16> randomUUID() {
  std::array<unsigned char, 16> bytes{};
  // So few bytes come whole, and once the kernel's generator is ready neither a signal nor a shortage stops
  // them. OpenSSL's own generator would cost a start 8 million instructions, and can fail for want of memory.
  if (getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) std::abort();
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
