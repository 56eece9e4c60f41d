// The text field of a dashboard packet: "key=value" items, shortest values first. Pure; any thread.
#pragma once

#include <cstddef>
#include <string_view>

#include "base/value.h"

namespace veltrad::backends {

// Writes into the 1,024 bytes of a packet's text field: at most 1,023 bytes, what is beyond is cut off. The
// field must outlive it.
class PacketText {
 public:
  static constexpr std::size_t kSize = 1024;  // with the terminating NUL

  explicit PacketText(char (&field)[kSize]) : _field(field) { _field[0] = '\0'; }

  // Each item is a blank, the key as it is, "=" and the sanitized description of the value. Items stand in
  // the order of their descriptions' length in characters, among equal ones in the order of their keys.
  void append(const Dictionary& payload);
  // The text without line breaks, with "\" and "=" escaped by a backslash; "empty" when that leaves nothing.
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
