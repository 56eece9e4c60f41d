// The constants of the binary property list format, for its reader and its writer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace veltrad::binary_property_list {

inline constexpr std::string_view kHeader = "bplist00";
inline constexpr std::size_t kTrailerSize = 32;

// Whole markers.
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

}  // namespace veltrad::binary_property_list
