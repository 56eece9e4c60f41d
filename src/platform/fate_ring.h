// SPDX-License-Identifier: Apache-2.0
// The record of fates: the decisions on messages and their results, in a ring of fixed size. Any thread,
// without locks, and nothing is allocated after construction, except for contents while somebody watches.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "platform/clock.h"
#include "platform/watched_contents.h"
#include "wire/fate_entries.h"

namespace veltrad::platform {

// Entries are in the order of writing; the oldest are overwritten. A position counts entries from 1 and is
// never used again. An entry refers to others, such as texts, only if they are at most refresh() older, so
// that they exist as long as the entry, except for the oldest few entries of the ring.
class FateRing {  // NOLINT(clang-analyzer-optin.performance.Padding): its counters have a cache line alone
 public:
  static constexpr std::size_t kLeastBytes = 64u << 10;
  static constexpr std::size_t kMostBytes = 256u << 20;
  static constexpr std::size_t kLongestText = 2048;

  // `bytes`, within the bounds above, hold entries, texts and the table that finds texts again. The clock
  // outlives the ring.
  FateRing(std::size_t bytes, const Clock& clock);

  // Microseconds since 1970.
  static std::int64_t microseconds(TimeValue time) { return time.seconds * 1'000'000 + time.microseconds; }
  std::int64_t now() const { return microseconds(_clock.now()); }
  // From 1. Those of batches, posts, files and log data have no gaps to speak of and mean nothing.
  std::uint64_t nextMessage() { return _messages.fetch_add(1, std::memory_order_relaxed) + 1; }
  std::uint64_t nextNumber() { return _numbers.fetch_add(1, std::memory_order_relaxed) + 1; }
  std::uint64_t messages() const { return _messages.load(std::memory_order_relaxed); }

  // Returns the entry's position.
  template <typename Entry>
  std::uint64_t write(const Entry& entry) {
    const std::uint64_t position = claim(1);
    put(position, wire::wordsOf(entry));
    return position;
  }
  // The position of the text, which is written again unless a fresh copy is in the ring. Texts longer than
  // kLongestText are truncated.
  std::uint64_t intern(std::string_view text);
  static wire::FateRef refTo(std::uint64_t position) { return static_cast<wire::FateRef>(position); }
  // Whether a new entry may refer to the one at this position.
  bool fresh(std::uint64_t position) const {
    return position != 0 && _next.load(std::memory_order_relaxed) - position <= _refresh;
  }

  // A part of the ring for a reader, which may fall behind the writers.
  struct Copy {
    std::string entries;     // for each its position and its words: 8 numbers of 8 bytes in the host's order
    std::uint64_t next = 0;  // where to go on
    std::uint64_t missing = 0;  // entries before `next` that could not be read any more
  };
  // If `patient`, stops at a new entry that is not written yet; else passes over it, for the case that it was
  // given up.
  Copy copy(std::uint64_t from, std::size_t most, bool patient = true) const;
  // The position of the next entry.
  std::uint64_t next() const { return _next.load(std::memory_order_acquire); }
  std::size_t size() const { return _size; }
  std::size_t refresh() const { return _refresh; }
  // The contents of messages, which are not in the record.
  WatchedContents& contents() { return _contents; }

 private:
  // The associativity of the table that finds texts.
  static constexpr std::size_t kWays = 4;
  static constexpr std::size_t kBuckets = 128;
  static constexpr std::size_t kTableBytes = kWays * kBuckets * sizeof(std::uint64_t);
  // A word with the position of the entry, and the entry.
  static constexpr std::size_t kSlotWords = 1 + wire::kFateWords;
  static constexpr std::size_t kSlotBytes = kSlotWords * sizeof(std::uint64_t);

  struct Free {
    void operator()(std::uint64_t* memory) const { std::free(memory); }
  };

  std::uint64_t claim(std::size_t entries) { return _next.fetch_add(entries, std::memory_order_relaxed); }
  void put(std::uint64_t position, const wire::FateWords& words);
  // False if the slot holds another entry.
  bool read(std::uint64_t position, wire::FateWords& words) const;
  bool holds(std::uint64_t position, const wire::TextEntry& first, std::string_view rest) const;
  std::span<std::uint64_t> slot(std::uint64_t position) const {
    return {_slots + position % _size * kSlotWords, kSlotWords};
  }

  const Clock& _clock;
  const std::size_t _size;  // in entries
  const std::size_t _refresh;
  // Zeroed memory, which the system allocates at the first use of each page.
  const std::unique_ptr<std::uint64_t[], Free> _memory;
  std::uint64_t* const _slots;
  std::uint64_t* const _texts;
  WatchedContents _contents;

  alignas(64) std::atomic<std::uint64_t> _next{1};
  std::atomic<std::uint64_t> _messages{0};
  std::atomic<std::uint64_t> _numbers{0};
};

}  // namespace veltrad::platform
