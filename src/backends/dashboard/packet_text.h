// SPDX-License-Identifier: Apache-2.0
// The text field of a dashboard packet: "key=value" items, shortest values first.
#pragma once

#include <cstddef>
#include <string_view>

#include "base/value.h"

namespace veltrad::backends {

// Writes at most 1,023 bytes and a NUL into a packet's text field, which must outlive it. Further bytes are
// cut off.
class PacketText {
 public:
  static constexpr std::size_t kSize = 1024;

  explicit PacketText(char (&field)[kSize]) : _field(field) { _field[0] = '\0'; }

  // Each item is a blank, the key, "=" and the sanitized description of the value. Items are sorted by the
  // length of the description in characters, then by key.
  void append(const Dictionary& payload);
  // Removes line breaks and escapes "\" and "=" with a backslash. An empty result becomes "empty".
  void sanitize(std::string_view text);

  std::size_t length() const { return _length; }
  bool cut() const { return _cut; }

 private:
  void put(std::string_view text);

  char* const _field;
  std::size_t _length = 0;
  bool _cut = false;
};

}  // namespace veltrad::backends
