// SPDX-License-Identifier: Apache-2.0
// Drives zlib.
#include "support/gunzip.h"

#include <zlib.h>

#include <algorithm>

namespace veltrad::support {

namespace {
// An argument of inflateInit2.
constexpr int kGzipOnly = 16 + MAX_WBITS;
constexpr unsigned kRoomBytes = 64u << 10;
// zlib reaches 1,032 times, with nothing but equal bytes.
constexpr std::uint64_t kMostRatio = 200;
constexpr std::uint64_t kBytesWithoutRatio = 32u << 20;
}  // namespace

Gunzip::Gunzip(std::uint64_t most) : _most(most), _stream(std::make_unique<z_stream>()) {
  if (::inflateInit2(_stream.get(), kGzipOnly) != Z_OK) _state = State::shortage;
}

Gunzip::~Gunzip() {
  ::inflateEnd(_stream.get());
}

Gunzip::State Gunzip::add(std::string_view& piece, const std::function<void(std::string_view)>& sink) {
  if (_state == State::ended && !piece.empty()) _state = State::tail;
  if (_state != State::open) return _state;
  char room[kRoomBytes];
  _stream->next_in = reinterpret_cast<Bytef*>(const_cast<char*>(piece.data()));
  _stream->avail_in = static_cast<uInt>(piece.size());
  do {
    _stream->next_out = reinterpret_cast<Bytef*>(room);
    _stream->avail_out = kRoomBytes;
    const int result = ::inflate(_stream.get(), Z_NO_FLUSH);
    const std::size_t count = kRoomBytes - _stream->avail_out;
    const std::size_t taken = piece.size() - _stream->avail_in;
    piece.remove_prefix(taken);
    _taken += taken;
    _unpacked += count;
    if (_unpacked > _most || _unpacked > std::max(kBytesWithoutRatio, kMostRatio * _taken))
      return _state = State::tooLarge;
    if (count > 0) sink({room, count});
    if (result == Z_STREAM_END) return _state = piece.empty() ? State::ended : State::tail;
    if (result == Z_MEM_ERROR) return _state = State::shortage;
    if (result != Z_OK && result != Z_BUF_ERROR) return _state = State::broken;
    // After the last byte zlib may still hold output.
  } while (piece.empty() && _stream->avail_out == 0);
  return _state;
}

}  // namespace veltrad::support
