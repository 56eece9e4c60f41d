// SPDX-License-Identifier: Apache-2.0
// Unpacks one gzip stream (RFC 1952) that comes in pieces.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

struct z_stream_s;

namespace veltrad::support {

class Gunzip {
 public:
  enum class State {
    // More is to come.
    open,
    // The stream ended with the last byte.
    ended,
    // It is no gzip stream, or a checksum is wrong.
    broken,
    // Bytes follow the stream.
    tail,
    // It unpacks to more than the bound, or to more than 32 MiB and 200 times what has come.
    tooLarge,
    // No memory for zlib.
    shortage,
  };

  // `most`: what the stream may unpack to, in bytes.
  explicit Gunzip(std::uint64_t most);
  ~Gunzip();

  // Unpacks from the front of the piece and hands what comes out to `sink`, at most 64 KiB at once. It stops
  // there and leaves the rest of the piece for the next call, because a small piece can become very large.
  // After a state other than open and ended, further pieces are ignored.
  State add(std::string_view& piece, const std::function<void(std::string_view)>& sink);
  State state() const { return _state; }
  std::uint64_t unpackedBytes() const { return _unpacked; }

 private:
  const std::uint64_t _most;
  std::unique_ptr<z_stream_s> _stream;
  State _state = State::open;
  std::uint64_t _taken = 0;
  std::uint64_t _unpacked = 0;
};

}  // namespace veltrad::support
