// Frames of the wire protocol (docs/wire-protocol.md): bytes in, frames out; no socket here. Any thread, one
// at a time.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "base/value.h"

namespace veltrad::ipc {

inline constexpr unsigned kWireVersion = 1;
inline constexpr std::size_t kFrameHeaderBytes = 12;
inline constexpr std::size_t kFrameBodyLimit = 1u << 20;        // 1,048,576
inline constexpr std::size_t kLargeFrameBodyLimit = 64u << 20;  // log data alone

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
};

// Collects bytes and yields whole frames. Its buffer grows with the bytes that came, never by what a header
// declares, and shrinks back to a small size once a large frame was taken.
class FrameReader {
 public:
  enum class Next { frame, needMore, impossible };

  // Where the next bytes go: at least `least` bytes of room. Then received() says how many came.
  std::pair<char*, std::size_t> room(std::size_t least = 4096);
  void received(std::size_t count);
  // The next whole frame; `impossible` is final, and the first time `frame` holds the header that was.
  Next next(Frame& frame);
  // A header has come but not yet its whole body.
  bool inFrame() const;
  // Nothing has come that was not handed out.
  bool empty() const { return _taken == _filled; }
  // What the buffer holds of memory.
  std::size_t size() const { return _buffer.size(); }

 private:
  std::string _buffer;      // its size is the room there is
  std::size_t _filled = 0;  // bytes that came
  std::size_t _taken = 0;   // of these, the ones already handed out in frames
  bool _impossible = false;
};

}  // namespace veltrad::ipc
