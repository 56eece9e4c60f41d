// SPDX-License-Identifier: Apache-2.0
// Puts binary property lists together byte by byte, valid or not, for tests. Any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace veltrad::test {

inline std::string bigEndian(std::uint64_t number, std::size_t size) {
  std::string bytes(size, '\0');
  for (std::size_t i = size; i > 0; --i, number >>= 8) bytes[i - 1] = static_cast<char>(number);
  return bytes;
}

struct Trailer {
  std::uint64_t offsetSize = 4;
  std::uint64_t referenceSize = 2;
  std::uint64_t count = 0;  // the builder sets these two
  std::uint64_t table = 0;
  std::uint64_t top = 0;
};

// `change` may modify the finished trailer.
template <typename Change>
std::string binaryList(const std::vector<std::string>& objects, Change change) {
  std::string bytes = "bplist00";
  std::string table;
  Trailer trailer;
  for (const std::string& object : objects) {
    table += bigEndian(bytes.size(), trailer.offsetSize);
    bytes += object;
  }
  trailer.count = objects.size();
  trailer.table = bytes.size();
  change(trailer);
  return bytes + table + std::string(6, '\0') + bigEndian(trailer.offsetSize, 1) +
         bigEndian(trailer.referenceSize, 1) + bigEndian(trailer.count, 8) + bigEndian(trailer.top, 8) +
         bigEndian(trailer.table, 8);
}
inline std::string binaryList(const std::vector<std::string>& objects) {
  return binaryList(objects, [](Trailer&) {});
}

// A text of up to 14 ASCII characters.
inline std::string ascii(const std::string& text) {
  return static_cast<char>(0x50 | text.size()) + text;
}

// A marker with its count, then references of two bytes.
inline std::string container(unsigned type, std::uint64_t count,
                             const std::vector<std::uint64_t>& references) {
  std::string bytes(1, static_cast<char>(type | (count < 15 ? count : 15)));
  if (count >= 15) bytes += "\x13" + bigEndian(count, 8);
  for (const auto reference : references) bytes += bigEndian(reference, 2);
  return bytes;
}

}  // namespace veltrad::test
