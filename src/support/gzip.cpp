// Compression with zlib's deflate, one pass over the whole input. Any thread.
#include "support/gzip.h"

#include <zlib.h>

#include <algorithm>
#include <limits>

#include "platform/log.h"

namespace veltrad {
namespace {

// The oldest version whose streams are known to be read.
constexpr const char* kZlibVersion = "1.2.8";
constexpr int kMemoryLevel = 8;
constexpr int kZlibWindowBits = 15;
constexpr int kGzipWindowBits = 15 + 16;  // a gzip header and trailer in place of zlib's
constexpr std::size_t kPieceBytes = 256u << 10;

const char* textAtInitialisation(int result) {
  switch (result) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_MEM_ERROR:
      return "Insufficient memory.";
    case Z_STREAM_ERROR:
      return "Invalid parameter passed in to function.";
    default:
      return "Unknown error code.";
  }
}

const char* textDuringCompression(int result) {
  switch (result) {
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    case Z_BUF_ERROR:
      return "Ran out of output buffer for writing compressed bytes.";
    case Z_MEM_ERROR:
      return "Memory could not be allocated for processing.";
    case Z_DATA_ERROR:
      return "The deflate data was invalid or incomplete.";
    case Z_STREAM_ERROR:
      return "The stream state was inconsistent (e.g., next_in or next_out was NULL).";
    case Z_ERRNO:
      return "Error occured while reading file.";
    default:
      return "Unknown error code.";
  }
}

const char* messageOf(const z_stream& stream) {
  return stream.msg != nullptr ? stream.msg : "(null)";
}

// One deflate stream; what goes wrong is logged. Ends with its owner.
class Deflation {
 public:
  Deflation() = default;
  ~Deflation() {
    if (_begun) deflateEnd(&_stream);
  }
  Deflation(const Deflation&) = delete;
  Deflation& operator=(const Deflation&) = delete;

  bool begin(bool gzip) {
    const int result =
        deflateInit2_(&_stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, gzip ? kGzipWindowBits : kZlibWindowBits,
                      kMemoryLevel, Z_DEFAULT_STRATEGY, kZlibVersion, sizeof _stream);
    _begun = result == Z_OK;
    if (!_begun) sayInitialisationFailed(result, _stream);
    return _begun;
  }
  z_stream& stream() { return _stream; }
  // Nothing is said of a result that is none of the failures.
  bool failed(int result) const {
    if (result == Z_OK || result == Z_STREAM_END) return false;
    logError("compressDataWithZlibOrGzip: zlib error while attempting compression: \"%s\" Message: \"%s\"",
             textDuringCompression(result), messageOf(_stream));
    return true;
  }
  static void sayInitialisationFailed(int result, const z_stream& stream) {
    logError("compressDataWithZlibOrGzip: deflateInit2() Error: \"%s\" Message: \"%s\"",
             textAtInitialisation(result), messageOf(stream));
  }

 private:
  z_stream _stream{};
  bool _begun = false;
};

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

// Takes what the stream has been given, or with Z_FINISH all there ever was, and appends what comes out.
int deflatePiece(z_stream& stream, int flush, std::string& buffer, std::string& output) {
  int result = Z_OK;
  do {
    stream.next_out = reinterpret_cast<Bytef*>(buffer.data());
    stream.avail_out = static_cast<uInt>(buffer.size());
    result = deflate(&stream, flush);
    output.append(buffer, 0, buffer.size() - stream.avail_out);
  } while (result == Z_OK && stream.avail_out == 0);
  return result == Z_BUF_ERROR && flush == Z_NO_FLUSH ? Z_OK : result;  // there was just nothing to do
}

void sayEmpty() {
  logError("compressDataWithZlibOrGzip: Cannot compress empty Torvane");
}

// It may wait long for a server, and bounds count its size.
std::string shrunk(std::string output, std::size_t from) {
  output.shrink_to_fit();
  logDebug("compressDataWithZlibOrGzip: Compressed file from %u to %u", static_cast<unsigned>(from),
           static_cast<unsigned>(output.size()));
  return output;
}

}  // namespace

std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes) {
  if (bytes.empty()) {
    sayEmpty();
    return std::nullopt;
  }
  Deflation deflation;
  z_stream& stream = deflation.stream();
  // zlib counts its input in 32 bits; what does not fit must not be cut off silently.
  if (bytes.size() > std::numeric_limits<uInt>::max()) {
    Deflation::sayInitialisationFailed(Z_STREAM_ERROR, stream);
    return std::nullopt;
  }
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));  // zlib only reads it
  stream.avail_in = static_cast<uInt>(bytes.size());
  if (!deflation.begin(gzip)) return std::nullopt;
  std::string output(deflateBound(&stream, bytes.size()), '\0');
  if (deflation.failed(deflateWhole(stream, output))) return std::nullopt;
  output.resize(stream.total_out);
  return shrunk(std::move(output), bytes.size());
}

std::optional<std::string> gzipDeflate(std::string_view bytes) {
  return compressDataWithZlibOrGzip(true, bytes);
}

std::optional<std::string> gzipDeflate(const ByteSource& source) {
  Deflation deflation;
  if (!deflation.begin(true)) return std::nullopt;
  z_stream& stream = deflation.stream();
  std::string piece(kPieceBytes, '\0'), buffer(kPieceBytes, '\0'), output;
  std::optional<std::size_t> count;
  do {
    count = source(piece.data(), piece.size());
    if (!count) return std::nullopt;
    stream.next_in = reinterpret_cast<Bytef*>(piece.data());
    stream.avail_in = static_cast<uInt>(*count);
    if (*count == 0 && stream.total_in == 0) {
      sayEmpty();
      return std::nullopt;
    }
    const int flush = *count == 0 ? Z_FINISH : Z_NO_FLUSH;
    if (deflation.failed(deflatePiece(stream, flush, buffer, output))) return std::nullopt;
  } while (*count > 0);
  return shrunk(std::move(output), stream.total_in);
}

}  // namespace veltrad
