// Compression with zlib's deflate, one pass over the input. Any thread.
#include "support/gzip.h"

#include <algorithm>
#include <limits>
#include <new>

#include "platform/log.h"

namespace veltrad::support {
namespace {

constexpr std::size_t kPieceBytes = 128u << 10;

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

void sayNoMemory() {
  logError("compressDataWithZlibOrGzip: Not enough memory to compress");
}

void sayCompressed(std::size_t from, std::size_t to) {
  logDebug("compressDataWithZlibOrGzip: Compressed file from %u to %u", static_cast<unsigned>(from),
           static_cast<unsigned>(to));
}

// False, and a line has said why.
bool deflateAll(const ByteSource& source, const ByteSink& sink) {
  Deflation deflation;
  if (!deflation.begin(Deflation::Wrapper::gzip)) return false;
  std::string piece(kPieceBytes, '\0'), buffer(kPieceBytes, '\0');
  std::size_t taken = 0, made = 0;
  const ByteSink counting = [&](std::string_view bytes) {
    made += bytes.size();
    return sink(bytes);
  };
  std::optional<std::size_t> count;
  do {
    count = source(piece.data(), piece.size());
    if (!count) return false;
    taken += *count;
    if (taken == 0) {
      sayEmpty();
      return false;
    }
    deflation.stream().next_in = reinterpret_cast<Bytef*>(piece.data());
    deflation.stream().avail_in = static_cast<uInt>(*count);
    if (!deflation.append(*count == 0 ? Z_FINISH : Z_NO_FLUSH, buffer, counting)) return false;
  } while (*count > 0);
  sayCompressed(taken, made);
  return true;
}

// Within what zlib counts.
std::optional<std::string> deflateBytes(bool gzip, std::string_view bytes) {
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

}  // namespace

std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes) {
  if (bytes.empty()) {
    sayEmpty();
    return std::nullopt;
  }
  // zlib counts its input in 32 bits; what does not fit must not be cut off silently.
  if (bytes.size() > std::numeric_limits<uInt>::max()) {
    logError("compressDataWithZlibOrGzip: Cannot compress %zu bytes: at most %u", bytes.size(),
             std::numeric_limits<uInt>::max());
    return std::nullopt;
  }
  try {
    return deflateBytes(gzip, bytes);
  } catch (const std::bad_alloc&) {
    sayNoMemory();
    return std::nullopt;
  }
}

std::optional<std::string> gzipDeflate(std::string_view bytes) {
  return compressDataWithZlibOrGzip(true, bytes);
}

bool gzipDeflate(const ByteSource& source, const ByteSink& sink) {
  try {
    return deflateAll(source, sink);
  } catch (const std::bad_alloc&) {
    sayNoMemory();
    return false;
  }
}

}  // namespace veltrad::support
