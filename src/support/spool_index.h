// SPDX-License-Identifier: Apache-2.0
// An index of the spool's posts in memory, of bounded size: finds the next post to send, and the one to drop.
// The owner guards it.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "support/spool_folder.h"

namespace veltrad::support {

// 48 bytes, so that the largest spool takes 3 MiB.
struct SpoolPlace {
  // writing: not on disk yet. unread: its file could not be read yet, so that its name and bytes alone are
  // known. gone: removed, and not yet taken out of the table.
  enum class State : std::uint8_t { writing, waiting, sending, unread, gone };

  SpoolFolder::Name name;
  std::uint32_t bytes = 0;  // of its file
  std::uint32_t events = 0;
  std::uint32_t connection = 0;
  std::uint32_t fate = 0;  // its number in the record of fates; 0: none
  std::uint16_t address = 0;
  std::uint16_t user = 0;
  std::uint16_t tries = 0;
  std::uint8_t backend = 0;
  State state = State::writing;
};
static_assert(sizeof(SpoolPlace) == 48);

struct SpoolBounds {
  std::uint64_t bytes = 67'108'864;
  double perUser = 0.5;  // of `bytes`
  std::size_t posts = 65'536;
};

// A place is valid until the next call that adds, takes out or makes room.
class SpoolIndex {
 public:
  enum class Excess { share, full };
  struct Amount {
    std::uint64_t posts = 0;
    std::uint64_t bytes = 0;
    std::uint64_t oldest = 0;  // its order; 0: there is none
  };

  explicit SpoolIndex(SpoolBounds bounds) : _bounds(bounds) {}

  // The number that stands for an address or a user in places, and back.
  std::uint16_t addressNumber(const std::string& address);
  std::uint16_t userNumber(std::uint32_t uid);
  const std::string& address(std::uint16_t number) const { return _addresses[number]; }

  void add(const SpoolPlace& place);
  // Null if it is not there.
  SpoolPlace* find(std::uint64_t order);
  void setBytes(SpoolPlace& place, std::uint32_t bytes);
  void takeOut(SpoolPlace& place);

  std::size_t size() const { return _count; }
  std::uint64_t bytes() const { return _bytes; }
  Amount amountAt(std::uint16_t address) const;
  std::uint64_t postsAt(std::uint16_t address) const { return _amounts[address].posts; }
  bool holdsOf(std::uint32_t connection, std::uint16_t address) const;
  // The post to be sent next: the oldest that waits and, of those of its connection and address, is the
  // oldest of all. With `oldestAlone`, nothing but the oldest of the address. `blocked`: one before it is
  // under way.
  SpoolPlace* next(std::uint16_t address, bool oldestAlone,
                   const std::function<bool(const SpoolPlace&)>& blocked = nullptr);
  // The oldest of all, unless it is being written or sent.
  SpoolPlace* oldest();
  // The post to drop while a bound is exceeded, and the reason: the oldest of a user above his share, else
  // the oldest of the user who takes most. A post that is being sent stays.
  SpoolPlace* excess(Excess& why);
  // In order, from the first one after this order.
  template <typename Visit>
  void visit(std::uint64_t after, const Visit& visit) const {
    for (std::size_t at = firstAfter(after); at < _places.size(); ++at) {
      if (_places[at].state != SpoolPlace::State::gone && !visit(_places[at])) return;
    }
  }

 private:
  struct User {
    std::uint32_t uid = 0;
    std::uint64_t bytes = 0;
    std::uint64_t posts = 0;
  };
  static constexpr std::size_t kCounts = 4096;
  static std::size_t countOf(std::uint32_t connection, std::uint16_t address) {
    return (connection * 2'654'435'761u + address) % kCounts;
  }

  std::size_t firstAfter(std::uint64_t order) const;
  SpoolPlace* oldestOf(std::uint16_t user);
  void compact();

  const SpoolBounds _bounds;
  // By order.
  std::vector<SpoolPlace> _places;
  std::size_t _begin = 0;  // all before are gone
  std::size_t _count = 0;
  std::uint64_t _bytes = 0;
  std::vector<std::string> _addresses;
  std::vector<Amount> _amounts;  // by address; without the oldest
  std::vector<User> _users;
  // Numbers of posts by a hash of connection and address, so that most searches are avoided.
  std::array<std::uint32_t, kCounts> _counts{};
};

}  // namespace veltrad::support
