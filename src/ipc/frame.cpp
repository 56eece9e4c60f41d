// Frames to bytes and back. Any thread, one at a time.
#include "ipc/frame.h"

#include <algorithm>
#include <cstring>

#include "base/property_list.h"

namespace veltrad::ipc {

namespace {

// An idle reader keeps no more than this.
constexpr std::size_t kKeptBytes = 64u << 10;

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
  if (_taken == _filled) {
    _taken = _filled = 0;
    if (_buffer.size() > kKeptBytes) _buffer = std::string();
  }
  if (_buffer.size() - _filled < least && _taken > 0) {
    std::memmove(_buffer.data(), _buffer.data() + _taken, _filled - _taken);
    _filled -= _taken;
    _taken = 0;
  }
  if (_buffer.size() - _filled < least) _buffer.resize(std::max(_filled + least, _filled + _filled / 2));
  return {_buffer.data() + _filled, _buffer.size() - _filled};
}

void FrameReader::received(std::size_t count) {
  _filled += count;
}

FrameReader::Next FrameReader::next(Frame& frame) {
  if (_impossible) return Next::impossible;
  const std::size_t available = _filled - _taken;
  if (available < kFrameHeaderBytes) return Next::needMore;
  const FrameHeader header = decodeFrameHeader(_buffer.data() + _taken);
  if (!header.possible()) {
    _impossible = true;
    frame.header = header;
    frame.body = {};
    return Next::impossible;
  }
  if (available - kFrameHeaderBytes < header.bodyLength) return Next::needMore;
  frame.header = header;
  frame.body = std::string_view(_buffer).substr(_taken + kFrameHeaderBytes, header.bodyLength);
  _taken += kFrameHeaderBytes + header.bodyLength;
  return Next::frame;
}

bool FrameReader::inFrame() const {
  return _filled - _taken >= kFrameHeaderBytes;
}

}  // namespace veltrad::ipc
