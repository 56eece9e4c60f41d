// Blocks in, one stream out. Both threads run the same loop.
#include "support/gzip_lanes.h"

#include <algorithm>
#include <new>
#include <system_error>
#include <thread>

#include "support/deflation.h"

namespace veltrad {

namespace {

constexpr std::size_t kBlockBytes = 512u << 10;
constexpr std::size_t kDictionaryBytes = 32u << 10;  // as far as deflate looks back
// RFC 1952, 2.3: deflate, no flags, no time, nothing special, Unix; as zlib writes it.
constexpr std::string_view kHeader{"\x1f\x8b\x08\0\0\0\0\0\0\x03", 10};

void appendLittleEndian(std::string& text, std::size_t number) {
  for (int i = 0; i < 4; ++i, number >>= 8) text += static_cast<char>(number & 0xff);
}

Bytef* input(const std::string& bytes) {
  return reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));  // zlib only reads it
}

}  // namespace

bool GzipLanes::run(std::size_t& taken) {
  {
    const Lock held(_mutex);
    _output += kHeader;
  }
  std::thread second;
  try {
    if (std::thread::hardware_concurrency() > 1) second = std::thread([this] { runLane(); });
  } catch (const std::system_error&) {
    // No thread is left: one does it, too.
  }
  runLane();
  if (second.joinable()) second.join();
  const Lock held(_mutex);
  appendLittleEndian(_output, _crc);
  appendLittleEndian(_output, _bytes);
  taken = _bytes;
  return !_failed;
}

void GzipLanes::runLane() {
  try {
    if (!compressBlocks()) fail();
  } catch (const std::bad_alloc&) {
    Deflation::sayInitialisationFailed(Z_MEM_ERROR, nullptr);
    fail();
  }
}

bool GzipLanes::compressBlocks() {
  Deflation deflation;
  if (!deflation.begin(Deflation::Wrapper::none)) return false;
  std::string buffer(kBlockBytes, '\0'), compressed;
  Block block;
  while (next(block)) {
    z_stream& stream = deflation.stream();
    deflateReset(&stream);
    deflateSetDictionary(&stream, input(block.dictionary), static_cast<uInt>(block.dictionary.size()));
    stream.next_in = input(block.bytes);
    stream.avail_in = static_cast<uInt>(block.bytes.size());
    compressed.clear();
    if (!deflation.append(block.last ? Z_FINISH : Z_SYNC_FLUSH, buffer, compressed)) return false;
    put(block, compressed, crc32(0, input(block.bytes), static_cast<uInt>(block.bytes.size())));
  }
  return true;
}

bool GzipLanes::next(Block& block) {
  if (!takeReading()) return false;
  const bool there = read(block.bytes);
  const Lock held(_mutex);
  _reading = false;
  _changed.notifyAll();
  if (!there) {
    _failed = true;
    return false;
  }
  const std::size_t size = block.bytes.size();
  block.last = _ended = size < kBlockBytes;
  block.number = _read++;
  block.dictionary = std::exchange(_tail, block.bytes.substr(size - std::min(size, kDictionaryBytes)));
  return true;
}

// The source may take locks of its own, so it is called under none.
bool GzipLanes::takeReading() {
  const Lock held(_mutex);
  while (_reading && !_failed) _changed.wait(_mutex);
  if (_ended || _failed) return false;
  _reading = true;
  return true;
}

// A whole block, or less at the end of all. False: no more can be had.
bool GzipLanes::read(std::string& bytes) {
  bytes.resize(kBlockBytes);
  std::size_t filled = 0;
  while (filled < kBlockBytes) {
    const auto count = _source(bytes.data() + filled, kBlockBytes - filled);
    if (!count) return false;
    if (*count == 0) break;
    filled += *count;
  }
  bytes.resize(filled);
  return true;
}

// Behind the block before it, for which it waits.
void GzipLanes::put(const Block& block, const std::string& compressed, unsigned long crc) {
  const Lock held(_mutex);
  while (_written != block.number && !_failed) _changed.wait(_mutex);
  if (_failed) return;
  _output += compressed;
  _crc = crc32_combine(_crc, crc, static_cast<z_off_t>(block.bytes.size()));
  _bytes += block.bytes.size();
  ++_written;
  _changed.notifyAll();
}

void GzipLanes::fail() {
  const Lock held(_mutex);
  _failed = true;
  _changed.notifyAll();
}

}  // namespace veltrad
