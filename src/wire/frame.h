// Frames of the wire protocol (docs/wire-protocol.md): bytes in, frames out; no socket here. Any thread, one
// at a time.
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
// An idle reader keeps no more than this, and so much of every buffer is nobody's to charge.
inline constexpr std::size_t kIdleReadBytes = 4096;

enum class FrameKind : std::uint8_t { hello = 1, call = 2, reply = 3, event = 4, refusal = 5, largeCall = 6 };

struct FrameHeader {
  std::uint32_t bodyLength = 0;
  FrameKind kind = FrameKind::call;  // a kind from the wire may be none of the names
  std::uint8_t descriptors = 0;
  std::uint32_t callID = 0;

  std::size_t bodyLimit() const {
    return kind == FrameKind::largeCall ? kLargeFrameBodyLimit : kFrameBodyLimit;
  }
  // Within its bound, and 0 or 1 descriptors; anything else ends the connection.
  bool possible() const { return bodyLength <= bodyLimit() && descriptors <= 1; }
};

FrameHeader decodeFrameHeader(const char* bytes /* kFrameHeaderBytes */);
void encodeFrameHeader(const FrameHeader& header, char* bytes /* kFrameHeaderBytes */);

// The frame, header and body, ready for the socket. A body beyond its bound is written all the same: the
// length of the result shows it.
std::string makeFrame(FrameKind kind, std::uint32_t callID, Dictionary body, std::uint8_t descriptors = 0);

struct Frame {
  FrameHeader header;
  std::string_view body;  // valid until the reader is next changed
  bool refused = false;   // there was no memory for it: its body was thrown away as it came
};

// Who pays for a reader's buffer. Asked on the reader's thread.
class FrameMemory {
 public:
  // The buffer is to have so many bytes, or has so many fewer now. False: no room, for now.
  virtual bool bufferOf(std::size_t bytes) = 0;
  // The header of a large call has come. False: its body is to be thrown away.
  virtual bool admitLargeCall(const FrameHeader& header) = 0;

 protected:
  ~FrameMemory() = default;
};

// Collects bytes and yields whole frames. Its buffer grows with the bytes that came, never by what a header
// declares.
class FrameReader {
 public:
  enum class Next { frame, needMore, impossible };

  FrameReader() = default;
  // `memory`, which outlives the reader, is asked; without it nobody is.
  explicit FrameReader(FrameMemory& memory) : _memory(&memory) {}

  // Where the next bytes go: at least `least` bytes of room, or null where there is no memory for it. Then
  // received() says how many came.
  std::pair<char*, std::size_t> room(std::size_t least = kIdleReadBytes);
  void received(std::size_t count);
  // The next whole frame; `impossible` is final, and the first time `frame` holds the header that was.
  Next next(Frame& frame);
  // A header has come but not yet its whole body.
  bool inFrame() const;
  // Nothing has come that was not handed out.
  bool empty() const { return _taken == _filled && !_toSkip; }
  // Nothing more is likely to come soon: the buffer shrinks to what is in it.
  void rest();

 private:
  bool resizeBuffer(std::size_t bytes);
  Next skip(Frame& frame);

  FrameMemory* _memory = nullptr;
  std::unique_ptr<char[]> _buffer;
  std::size_t _capacity = 0;
  std::size_t _filled = 0;  // bytes that came
  std::size_t _taken = 0;   // of these, the ones already handed out in frames
  bool _impossible = false;
  bool _admitted = false;  // the large call at the front
  FrameHeader _skipped;    // of the frame whose body is thrown away
  std::optional<std::size_t> _toSkip;
};

}  // namespace veltrad::wire
