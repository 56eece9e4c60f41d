// SPDX-License-Identifier: Apache-2.0
// Encodes and decodes frames.
#include "wire/frame.h"

#include <algorithm>
#include <cstring>
#include <new>

#include "base/property_list.h"

namespace veltrad::wire {

namespace {

std::uint32_t readBigEndian(const char* bytes) {
  std::uint32_t number = 0;
  for (int i = 0; i < 4; ++i) number = number << 8 | static_cast<unsigned char>(bytes[i]);
  return number;
}

void writeBigEndian(std::uint32_t number, char* bytes) {
  for (int i = 3; i >= 0; --i, number >>= 8) bytes[i] = static_cast<char>(number & 0xff);
}

}  // namespace

FrameHeader decodeFrameHeader(const char* bytes) {
  FrameHeader header;
  header.bodyLength = readBigEndian(bytes);
  header.kind = static_cast<FrameKind>(static_cast<unsigned char>(bytes[4]));
  header.descriptors = static_cast<unsigned char>(bytes[5]);
  header.callID = readBigEndian(bytes + 8);
  return header;
}

void encodeFrameHeader(const FrameHeader& header, char* bytes) {
  writeBigEndian(header.bodyLength, bytes);
  bytes[4] = static_cast<char>(header.kind);
  bytes[5] = static_cast<char>(header.descriptors);
  bytes[6] = bytes[7] = 0;
  writeBigEndian(header.callID, bytes + 8);
}

std::string makeFrame(FrameKind kind, std::uint32_t callID, Dictionary body, std::uint8_t descriptors) {
  std::string frame(kFrameHeaderBytes, '\0');
  appendBinaryPropertyList(Value(std::move(body)), frame);
  FrameHeader header;
  header.bodyLength =
      static_cast<std::uint32_t>(std::min<std::size_t>(frame.size() - kFrameHeaderBytes, std::uint32_t(-1)));
  header.kind = kind;
  header.descriptors = descriptors;
  header.callID = callID;
  encodeFrameHeader(header, frame.data());
  return frame;
}

std::pair<char*, std::size_t> FrameReader::room(std::size_t least) {
  if (_taken == _filled) _taken = _filled = 0;
  if (_capacity - _filled < least && _taken > 0) {
    std::memmove(_buffer.get(), _buffer.get() + _taken, _filled - _taken);
    _filled -= _taken;
    _taken = 0;
  }
  if (_capacity - _filled < least && !resizeBuffer(std::max(_filled + least, _filled + _filled / 2))) {
    return {nullptr, 0};
  }
  return {_buffer.get() + _filled, _capacity - _filled};
}

// Drops the consumed bytes. While the buffer grows, both the old and the new one are charged.
bool FrameReader::resizeBuffer(std::size_t bytes) {
  if (_memory && bytes > _capacity && !_memory->bufferOf(_capacity + bytes)) return false;
  std::unique_ptr<char[]> fresh(bytes > 0 ? new (std::nothrow) char[bytes] : nullptr);
  if (fresh || bytes == 0) {
    if (_filled > _taken) std::memcpy(fresh.get(), _buffer.get() + _taken, _filled - _taken);
    _buffer = std::move(fresh);
    _capacity = bytes;
    _filled -= _taken;
    _taken = 0;
  }
  if (_memory) _memory->bufferOf(_capacity);
  return _capacity == bytes;
}

void FrameReader::rest() {
  // The buffer of an unfinished frame keeps its spare room.
  const std::size_t wanted = std::max(_filled - _taken, kIdleReadBytes);
  if (_capacity > wanted + wanted / 2 + kIdleReadBytes) resizeBuffer(wanted);
}

bool FrameReader::frameWaits() const {
  const std::size_t available = _filled - _taken;
  if (available < kFrameHeaderBytes) return false;
  return decodeFrameHeader(_buffer.get() + _taken).bodyLength <= available - kFrameHeaderBytes;
}

FrameReader::Next FrameReader::next(Frame& frame) {
  if (_impossible) return Next::impossible;
  if (_toSkip) return skip(frame);
  const std::size_t available = _filled - _taken;
  if (available < kFrameHeaderBytes) return Next::needMore;
  const FrameHeader header = decodeFrameHeader(_buffer.get() + _taken);
  if (!header.possible()) {
    _impossible = true;
    frame = {header, {}, false};
    return Next::impossible;
  }
  if (header.kind == FrameKind::largeCall && !_admitted) {
    if (_memory && !_memory->admitLargeCall(header)) {
      _skipped = header;
      _toSkip = header.bodyLength;
      _taken += kFrameHeaderBytes;
      return skip(frame);
    }
    _admitted = true;
  }
  if (available - kFrameHeaderBytes < header.bodyLength) return Next::needMore;
  frame = {header, {_buffer.get() + _taken + kFrameHeaderBytes, header.bodyLength}, false};
  _taken += kFrameHeaderBytes + header.bodyLength;
  _admitted = false;
  return Next::frame;
}

FrameReader::Next FrameReader::skip(Frame& frame) {
  const std::size_t count = std::min(*_toSkip, _filled - _taken);
  _taken += count;
  *_toSkip -= count;
  if (*_toSkip > 0) return Next::needMore;
  _toSkip.reset();
  frame = {_skipped, {}, true};
  return Next::frame;
}

}  // namespace veltrad::wire
