// Compression with zlib's deflate, one pass over the input. Any thread.
#include "support/gzip.h"

#include <algorithm>
#include <limits>
#include <new>

#include "platform/log.h"
#include "support/deflation.h"
#include "support/gzip_lanes.h"

namespace veltrad {
namespace {

constexpr std::size_t kPieceBytes = 256u << 10;
// From here on a second thread is worth its price.
constexpr std::size_t kBytesForLanes = 4u << 20;

// Fills `output` from its start; the number of bytes produced is stream.total_out. Z_STREAM_END: all is
// there.
int deflateWhole(z_stream& stream, std::string& output) {
  constexpr std::size_t kMostSpace = std::numeric_limits<uInt>::max();
  int result = Z_OK;
  while (result == Z_OK) {
    const std::size_t produced = stream.total_out;
    stream.next_out = reinterpret_cast<Bytef*>(output.data() + produced);
    stream.avail_out = static_cast<uInt>(std::min(output.size() - produced, kMostSpace));
    result = deflate(&stream, Z_FINISH);
  }
  return result;
}

void sayEmpty() {
  logError("compressDataWithZlibOrGzip: Cannot compress empty Torvane");
}

void sayCompressed(std::size_t from, std::size_t to) {
  logDebug("compressDataWithZlibOrGzip: Compressed file from %u to %u", static_cast<unsigned>(from),
           static_cast<unsigned>(to));
}

// False, and a line has said why.
bool deflateAll(const ByteSource& source, std::string& output, std::size_t& taken) {
  Deflation deflation;
  if (!deflation.begin(Deflation::Wrapper::gzip)) return false;
  std::string piece(kPieceBytes, '\0'), buffer(kPieceBytes, '\0');
  std::optional<std::size_t> count;
  do {
    count = source(piece.data(), piece.size());
    if (!count) return false;
    taken += *count;
    deflation.stream().next_in = reinterpret_cast<Bytef*>(piece.data());
    deflation.stream().avail_in = static_cast<uInt>(*count);
    if (!deflation.append(*count == 0 ? Z_FINISH : Z_NO_FLUSH, buffer, output)) return false;
  } while (*count > 0);
  return true;
}

std::optional<std::string> deflateSource(const ByteSource& source, std::size_t expected) {
  std::string output;
  // Only what is written to costs memory, so there is room to spare for blocks that end early.
  output.reserve(compressBound(expected) + expected / 256);
  std::size_t taken = 0;
  const bool done =
      expected < kBytesForLanes ? deflateAll(source, output, taken) : GzipLanes(source, output).run(taken);
  if (!done) return std::nullopt;
  if (taken == 0) {
    sayEmpty();
    return std::nullopt;
  }
  sayCompressed(taken, output.size());
  return output;
}

}  // namespace

std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes) {
  if (bytes.empty()) {
    sayEmpty();
    return std::nullopt;
  }
  // zlib counts its input in 32 bits; what does not fit must not be cut off silently.
  if (bytes.size() > std::numeric_limits<uInt>::max()) {
    Deflation::sayInitialisationFailed(Z_STREAM_ERROR, nullptr);
    return std::nullopt;
  }
  Deflation deflation;
  if (!deflation.begin(gzip ? Deflation::Wrapper::gzip : Deflation::Wrapper::zlib)) return std::nullopt;
  z_stream& stream = deflation.stream();
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));  // zlib only reads it
  stream.avail_in = static_cast<uInt>(bytes.size());
  std::string output(deflateBound(&stream, bytes.size()), '\0');
  if (deflation.failed(deflateWhole(stream, output))) return std::nullopt;
  output.resize(stream.total_out);
  output.shrink_to_fit();  // it may wait long for a server, and bounds count its size
  sayCompressed(bytes.size(), output.size());
  return output;
}

std::optional<std::string> gzipDeflate(std::string_view bytes) {
  return compressDataWithZlibOrGzip(true, bytes);
}

std::optional<std::string> gzipDeflate(const ByteSource& source, std::size_t expected) {
  try {
    return deflateSource(source, expected);
  } catch (const std::bad_alloc&) {
    Deflation::sayInitialisationFailed(Z_MEM_ERROR, nullptr);
    return std::nullopt;
  }
}

}  // namespace veltrad
