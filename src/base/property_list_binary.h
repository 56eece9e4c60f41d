// SPDX-License-Identifier: Apache-2.0
// The binary property list format: its constants, and its trailer.
#pragma once

#include <endian.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "base/property_list.h"
#include "base/result.h"

namespace veltrad::binary_property_list {

inline constexpr std::string_view kHeader = "bplist00";
inline constexpr std::size_t kTrailerSize = 32;

// Markers that fill the whole byte.
inline constexpr std::uint8_t kNull = 0x00;
inline constexpr std::uint8_t kFalse = 0x08;
inline constexpr std::uint8_t kTrue = 0x09;
inline constexpr std::uint8_t kDate = 0x33;
// Upper halves of markers; the lower half is a count or the logarithm of a size.
inline constexpr std::uint8_t kSimple = 0x00;
inline constexpr std::uint8_t kInteger = 0x10;
inline constexpr std::uint8_t kReal = 0x20;
inline constexpr std::uint8_t kData = 0x40;
inline constexpr std::uint8_t kASCII = 0x50;
inline constexpr std::uint8_t kUTF16 = 0x60;
inline constexpr std::uint8_t kUID = 0x80;
inline constexpr std::uint8_t kArray = 0xA0;
inline constexpr std::uint8_t kSet = 0xC0;
inline constexpr std::uint8_t kDictionary = 0xD0;

inline constexpr double kSecondsFrom1970To2001 = 978'307'200;

// `size` is 1 to 8.
inline std::uint64_t bigEndian(const char* at, std::size_t size) {
  std::uint64_t number = static_cast<std::uint8_t>(at[0]);
  // Nearly all references have 1 byte, and nearly all offsets 1 or 2.
  if (size == 1) return number;
  if (size == 2) return number << 8 | static_cast<std::uint8_t>(at[1]);
  if (size == 8) {
    std::memcpy(&number, at, 8);
    return be64toh(number);
  }
  for (std::size_t i = 1; i < size; ++i) number = number << 8 | static_cast<std::uint8_t>(at[i]);
  return number;
}

struct Trailer {
  // Bytes of an offset in the table, and of a reference to an object: 1 to 8.
  std::size_t offsetSize = 0;
  std::size_t referenceSize = 0;
  // Objects in the list, and the number of the outermost one.
  std::uint64_t count = 0;
  std::uint64_t top = 0;
  // Where the table of offsets begins, which ends the objects.
  std::uint64_t table = 0;
};

// `bytes` begin with the header. The table lies within them.
Result<Trailer, PropertyListError> parseTrailer(std::string_view bytes);

}  // namespace veltrad::binary_property_list
