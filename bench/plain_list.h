// SPDX-License-Identifier: Apache-2.0
// A reader of binary property lists as plain as can be: no bounds, no checks, each object once. Only to know
// what reading costs at least.
#pragma once

#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace bench {

class PlainList {
 public:
  explicit PlainList(std::string_view bytes) : _bytes(bytes) {
    const std::size_t trailer = bytes.size() - 32;
    _offsetBytes = number(trailer + 6, 1);
    _referenceBytes = number(trailer + 7, 1);
    _nodes.resize(number(trailer + 8, 8));
    _table = number(trailer + 24, 8);
    for (std::size_t i = 0; i < _nodes.size(); ++i)
      read(_nodes[i], number(_table + i * _offsetBytes, _offsetBytes));
  }

  // How many objects were read.
  std::size_t objects() const { return _nodes.size(); }

 private:
  struct Node {
    std::string text;
    double real = 0;
    std::uint64_t integer = 0;
    std::vector<std::pair<std::uint32_t, std::uint32_t>> entries;  // of a dictionary: key, value
  };

  std::uint64_t number(std::size_t place, std::size_t count) const {
    std::uint64_t value = 0;
    for (std::size_t i = 0; i < count; ++i) value = value << 8 | static_cast<std::uint8_t>(_bytes[place + i]);
    return value;
  }

  void read(Node& node, std::size_t place) {
    const auto marker = static_cast<std::uint8_t>(_bytes[place++]);
    std::size_t count = marker & 0xfu;
    if ((marker >> 4 == 5 || marker >> 4 == 0xd) && count == 0xf) {
      const std::size_t width = std::size_t{1} << (static_cast<std::uint8_t>(_bytes[place]) & 0xfu);
      count = number(place + 1, width);
      place += 1 + width;
    }
    switch (marker >> 4) {
      case 1:
        node.integer = number(place, std::size_t{1} << count);
        break;
      case 2: {
        const std::uint64_t bits = number(place, 8);
        std::memcpy(&node.real, &bits, sizeof bits);
        break;
      }
      case 5:
        node.text.assign(_bytes.substr(place, count));
        break;
      case 0xd:
        node.entries.reserve(count);
        for (std::size_t i = 0; i < count; ++i) {
          node.entries.emplace_back(number(place + i * _referenceBytes, _referenceBytes),
                                    number(place + (count + i) * _referenceBytes, _referenceBytes));
        }
        break;
      default:
        break;
    }
  }

  std::string_view _bytes;
  std::size_t _offsetBytes = 0;
  std::size_t _referenceBytes = 0;
  std::size_t _table = 0;
  std::vector<Node> _nodes;
};

}  // namespace bench
