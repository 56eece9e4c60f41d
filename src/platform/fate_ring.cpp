// SPDX-License-Identifier: Apache-2.0
// Writes, finds and copies entries. The first word of a slot is twice the position of its entry, plus one
// while the entry is being written.
#include "platform/fate_ring.h"

#include <algorithm>
#include <cstring>

#include "base/text.h"

namespace veltrad::platform {

namespace {
constexpr std::size_t kRefreshShare = 16;
// An entry that was claimed and is not written yet is waited for by readers while it is so new.
constexpr std::uint64_t kPatience = 64;
constexpr std::size_t kMoreBytes = sizeof(wire::MoreTextEntry::bytes);

std::uint64_t load(std::uint64_t& word, std::memory_order order = std::memory_order_acquire) {
  return std::atomic_ref(word).load(order);
}
void store(std::uint64_t& word, std::uint64_t value, std::memory_order order = std::memory_order_release) {
  std::atomic_ref(word).store(value, order);
}

// Zeros, and room to begin at a cache line.
std::uint64_t* zeros(std::size_t bytes) {
  void* memory = std::calloc(bytes + 64, 1);
  if (memory == nullptr) std::abort();  // at start, and there is no memory at all
  return static_cast<std::uint64_t*>(memory);
}

std::uint64_t* atCacheLine(std::uint64_t* memory) {
  return memory + (64 - reinterpret_cast<std::uintptr_t>(memory) % 64) % 64 / sizeof(std::uint64_t);
}

std::uint64_t hashedWith(std::uint64_t hash, std::uint64_t word) {
  hash = (hash ^ word) * 0x9E3779B97F4A7C15u;
  return hash ^ (hash >> 32);
}

template <typename Entry>
std::string_view fill(Entry& entry, std::string_view text) {
  const std::size_t taken = std::min(text.size(), sizeof entry.bytes);
  std::memcpy(entry.bytes, text.data(), taken);
  return text.substr(taken);
}
}  // namespace

FateRing::FateRing(std::size_t bytes, const Clock& clock)
    : _clock(clock),
      _size((std::clamp(bytes, kLeastBytes, kMostBytes) - kTableBytes) / kSlotBytes),
      _refresh(_size / kRefreshShare),
      _memory(zeros(_size * kSlotBytes + kTableBytes)),
      _slots(atCacheLine(_memory.get())),
      _texts(_slots + _size * kSlotWords) {}

// A writer that was overtaken by a whole round gives up, and so does one that finds the slot still being
// written; that loses an entry, and no reader takes one for the other.
void FateRing::put(std::uint64_t position, const wire::FateWords& words) {
  const auto slot = this->slot(position);
  std::uint64_t before = load(slot[0], std::memory_order_relaxed);
  if (before % 2 == 1 || before > 2 * position) return;
  if (!std::atomic_ref(slot[0]).compare_exchange_strong(before, 2 * position + 1, std::memory_order_acq_rel))
    return;
  for (std::size_t i = 0; i < words.size(); ++i) store(slot[i + 1], words[i]);
  store(slot[0], 2 * position);
}

bool FateRing::read(std::uint64_t position, wire::FateWords& words) const {
  const auto slot = this->slot(position);
  if (load(slot[0]) != 2 * position) return false;
  for (std::size_t i = 0; i < words.size(); ++i) words[i] = load(slot[i + 1]);
  return load(slot[0], std::memory_order_relaxed) == 2 * position;
}

std::uint64_t FateRing::intern(std::string_view text) {
  if (text.size() > kLongestText) text = withoutIncompleteEnd(text.substr(0, kLongestText));
  wire::TextEntry first;
  first.length = static_cast<std::uint16_t>(text.size());
  const std::string_view rest = fill(first, text);
  std::uint64_t hash = first.length;
  for (const std::uint64_t word : wire::wordsOf(first)) hash = hashedWith(hash, word);
  for (const char byte : rest) hash = hashedWith(hash, static_cast<unsigned char>(byte));
  first.hash = static_cast<std::uint32_t>(hash >> 32);

  const std::span<std::uint64_t> ways(_texts + hash % kBuckets * kWays, kWays);
  std::uint64_t* oldest = &ways[0];
  for (std::uint64_t& way : ways) {
    const std::uint64_t position = load(way, std::memory_order_relaxed);
    if (fresh(position) && holds(position, first, rest)) return position;
    if (position < load(*oldest, std::memory_order_relaxed)) oldest = &way;
  }
  const std::uint64_t position = claim(1 + (rest.size() + kMoreBytes - 1) / kMoreBytes);
  put(position, wire::wordsOf(first));
  std::uint64_t next = position;
  for (std::string_view left = rest; !left.empty();) {
    wire::MoreTextEntry more;
    left = fill(more, left);
    put(++next, wire::wordsOf(more));
  }
  store(*oldest, position, std::memory_order_relaxed);
  return position;
}

bool FateRing::holds(std::uint64_t position, const wire::TextEntry& first, std::string_view rest) const {
  wire::FateWords words;
  if (!read(position, words) || words != wire::wordsOf(first)) return false;
  for (std::string_view left = rest; !left.empty();) {
    wire::MoreTextEntry more;
    left = fill(more, left);
    if (!read(++position, words) || words != wire::wordsOf(more)) return false;
  }
  return true;
}

FateRing::Copy FateRing::copy(std::uint64_t from, std::size_t most, bool patient) const {
  const std::uint64_t end = next();
  const std::uint64_t oldest = end > _size ? end - _size : 1;
  Copy result;
  result.next = std::clamp(from, oldest, end);
  result.missing = result.next > from ? result.next - from : 0;
  result.entries.reserve(std::min<std::size_t>(most, end - result.next) * kSlotBytes);
  for (std::size_t i = 0; i < most && result.next < end; ++i, ++result.next) {
    wire::FateWords words;
    if (read(result.next, words)) {
      const std::uint64_t position = result.next;
      result.entries.append(reinterpret_cast<const char*>(&position), sizeof position);
      result.entries.append(reinterpret_cast<const char*>(words.data()), sizeof words);
    } else if (patient && next() - result.next <= kPatience &&
               load(slot(result.next)[0]) < 2 * (result.next + 1)) {
      break;
    } else {
      ++result.missing;
    }
  }
  return result;
}

}  // namespace veltrad::platform
