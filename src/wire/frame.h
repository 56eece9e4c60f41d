// SPDX-License-Identifier: Apache-2.0
// Frames of the wire protocol (docs/wire-protocol.md), read from and written to memory.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "base/value.h"
#include "wire/limits.h"

namespace veltrad::wire {

inline constexpr unsigned kWireVersion = 1;
inline constexpr std::size_t kFrameHeaderBytes = 12;
// An idle reader keeps no more than this. This much of every buffer is not charged to anybody.
inline constexpr std::size_t kIdleReadBytes = 4096;

enum class FrameKind : std::uint8_t { hello = 1, call = 2, reply = 3, event = 4, refusal = 5, largeCall = 6 };

struct FrameHeader {
  std::uint32_t bodyLength = 0;
  // A kind that was read may be none of the enumerators.
  FrameKind kind = FrameKind::call;
  std::uint8_t descriptors = 0;
  std::uint32_t callID = 0;

  std::size_t bodyLimit() const {
    return kind == FrameKind::largeCall ? kLargeFrameBodyLimit : kFrameBodyLimit;
  }
  // False if the length or the number of descriptors (0 or 1) is out of bounds; that ends the connection.
  bool possible() const { return bodyLength <= bodyLimit() && descriptors <= 1; }
};

// `bytes` are kFrameHeaderBytes.
FrameHeader decodeFrameHeader(const char* bytes);
void encodeFrameHeader(const FrameHeader& header, char* bytes);

// A whole frame. A body beyond its bound is written too; the caller sees it by the length of the result.
std::string makeFrame(FrameKind kind, std::uint32_t callID, Dictionary body, std::uint8_t descriptors = 0);

struct Frame {
  FrameHeader header;
  // Valid until the next call on the reader.
  std::string_view body;
  // There was no memory for the frame, so its body was discarded.
  bool refused = false;
};

// Charges the memory of a reader's buffer. Called on the reader's thread.
class FrameMemory {
 public:
  // The buffer is about to grow to this size, or has shrunk to it. False if there is no memory for now.
  virtual bool bufferOf(std::size_t bytes) = 0;
  // Called when the header of a large call has arrived. If false, the body is discarded.
  virtual bool admitLargeCall(const FrameHeader& header) = 0;

 protected:
  ~FrameMemory() = default;
};

// Collects bytes and returns whole frames. Its buffer grows with the bytes that arrive, not with the length
// that a header declares.
class FrameReader {
 public:
  enum class Next { frame, needMore, impossible };

  FrameReader() = default;
  // `memory` must outlive the reader.
  explicit FrameReader(FrameMemory& memory) : _memory(&memory) {}

  // Returns room for the next bytes, at least `least`, or null if there is no memory. After writing there,
  // call received() with the number of bytes.
  std::pair<char*, std::size_t> room(std::size_t least = kIdleReadBytes);
  void received(std::size_t count) { _filled += count; }
  // The next whole frame. `impossible` is final; the first time, `frame` holds the header in question.
  Next next(Frame& frame);
  // True if next() will return a frame.
  bool frameWaits() const;
  // True if everything that was received has been handed out.
  bool empty() const { return _taken == _filled && !_toSkip; }
  // Shrinks the buffer to its content. To be called when nothing more is expected soon.
  void rest();

 private:
  bool resizeBuffer(std::size_t bytes);
  Next skip(Frame& frame);

  FrameMemory* _memory = nullptr;
  std::unique_ptr<char[]> _buffer;
  std::size_t _capacity = 0;
  // Bytes received, and how many of these were handed out in frames.
  std::size_t _filled = 0;
  std::size_t _taken = 0;
  bool _impossible = false;
  // Whether the large call at the front was admitted.
  bool _admitted = false;
  // The header of a frame whose body is being discarded, and the bytes that are still to come of it.
  FrameHeader _skipped;
  std::optional<std::size_t> _toSkip;
};

}  // namespace veltrad::wire
