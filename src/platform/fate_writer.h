// SPDX-License-Identifier: Apache-2.0
// Writes the processing steps of one back end's messages into the record of fates. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/fate_ring.h"

namespace veltrad::platform {

// A copy writes for the same back end. The ring must outlive it.
class FateWriter {
 public:
  // Writes nothing.
  FateWriter() = default;
  // `ring` may be null; `backend`: its name, or empty for all of a session's.
  FateWriter(FateRing* ring, std::string_view backend)
      : _ring(ring), _backend(wire::numberOfBackend(backend)) {}

  bool writes() const { return _ring != nullptr; }
  // Null if it writes nothing.
  FateRing* ring() const { return _ring; }
  std::uint8_t backend() const { return _backend; }
  // For a batch, a post, a file or log data; 0 if it writes nothing.
  std::uint64_t newNumber() const { return _ring ? _ring->nextNumber() : 0; }
  wire::FateRef textOf(std::string_view text) const {
    return _ring ? FateRing::refTo(_ring->intern(text)) : wire::FateRef{0};
  }

  // The same for a text that is used often: `position` remembers its place, 0 at first.
  wire::FateRef textOf(std::string_view text, std::uint64_t& position) const {
    if (!_ring) return 0;
    if (!_ring->fresh(position)) position = _ring->intern(text);
    return FateRing::refTo(position);
  }

  // `entry` names the message, batch or post, with further data; a time of 0 means now.
  void write(wire::Step step, std::optional<wire::Reason> reason, wire::StepEntry entry) const {
    if (!_ring) return;
    entry.step = step;
    if (reason) entry.reason = static_cast<std::uint8_t>(*reason);
    entry.backend = _backend;
    if (entry.time == 0) entry.time = _ring->now();
    _ring->write(entry);
  }

 private:
  FateRing* _ring = nullptr;
  std::uint8_t _backend = 0;
};

}  // namespace veltrad::platform
