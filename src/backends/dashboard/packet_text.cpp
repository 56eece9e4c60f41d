// SPDX-License-Identifier: Apache-2.0
// Sorts, escapes and cuts the items of a payload.
#include "backends/dashboard/packet_text.h"

#include <algorithm>
#include <cstring>
#include <vector>

#include "backends/dashboard/value_description.h"

namespace veltrad::backends {

namespace {
struct Item {
  const std::string* key;
  ValueDescription value;
};

std::vector<Item> itemsInOrder(const Dictionary& payload) {
  std::vector<Item> items;
  items.reserve(payload.size());
  for (const auto& [key, value] : payload) items.push_back({&key, descriptionForObject(value)});
  std::sort(items.begin(), items.end(), [](const Item& a, const Item& b) {
    const std::size_t lengthA = a.value.characters();
    const std::size_t lengthB = b.value.characters();
    return lengthA != lengthB ? lengthA < lengthB : *a.key < *b.key;
  });
  return items;
}

bool isSpecial(char c) {
  return c == '\n' || c == '\\' || c == '=';
}

// The field is NUL-terminated, so each text ends at its first NUL.
std::string_view untilNUL(std::string_view text) {
  return text.substr(0, text.find('\0'));
}
}  // namespace

void PacketText::append(const Dictionary& payload) {
  for (const Item& item : itemsInOrder(payload)) {
    put(" ");
    put(untilNUL(*item.key));
    put("=");
    sanitize(item.value.text());
    if (_cut) return;
  }
}

void PacketText::sanitize(std::string_view text) {
  if (text.find_first_not_of('\n') == std::string_view::npos) return put("empty");
  text = untilNUL(text);
  while (!text.empty() && !_cut) {
    const auto plain = std::find_if(text.begin(), text.end(), isSpecial) - text.begin();
    put(text.substr(0, static_cast<std::size_t>(plain)));
    text.remove_prefix(static_cast<std::size_t>(plain));
    if (text.empty()) return;
    if (text.front() == '\\') put("\\\\");
    if (text.front() == '=') put("\\=");
    text.remove_prefix(1);
  }
}

void PacketText::put(std::string_view text) {
  const std::size_t fits = std::min(text.size(), kSize - 1 - _length);
  std::memcpy(_field + _length, text.data(), fits);
  _length += fits;
  _field[_length] = '\0';
  _cut = _cut || fits < text.size();
}

}  // namespace veltrad::backends
