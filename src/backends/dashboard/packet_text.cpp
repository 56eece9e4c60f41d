// SPDX-License-Identifier: Apache-2.0
// Sorts, escapes and cuts the items of a payload.
#include "backends/dashboard/packet_text.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <string>
#include <vector>

namespace veltrad::backends {

namespace {
struct Item {
  const std::string* key;
  const std::string* held;  // the value's own text; null: `made`
  std::string made;
  std::size_t characters;

  std::string_view text() const { return held ? *held : made; }
};

std::size_t charactersOf(std::string_view text) {
  const auto beginsCharacter = [](char c) { return (static_cast<unsigned char>(c) & 0xC0) != 0x80; };
  return static_cast<std::size_t>(std::count_if(text.begin(), text.end(), beginsCharacter));
}

// Texts unchanged, numbers in decimal (reals as short as reads back the same), booleans as 1 and 0, anything
// else as "null".
Item itemOf(const Dictionary::Entry& entry) {
  Item item{&entry.first, entry.second.asString(), {}, 0};
  if (!item.held) item.made = entry.second.toText().value_or("null");
  item.characters = charactersOf(item.text());
  return item;
}

std::vector<Item> itemsInOrder(const Dictionary& payload) {
  std::vector<Item> items;
  items.reserve(payload.size());
  std::transform(payload.begin(), payload.end(), std::back_inserter(items), itemOf);
  std::sort(items.begin(), items.end(), [](const Item& a, const Item& b) {
    return a.characters != b.characters ? a.characters < b.characters : *a.key < *b.key;
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
    sanitize(item.text());
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
