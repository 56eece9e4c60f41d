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

}  // namespace

std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes) {
  if (bytes.empty()) {
    logError("compressDataWithZlibOrGzip: Cannot compress empty Torvane");
    return std::nullopt;
  }
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes.data()));  // zlib only reads it
  stream.avail_in = static_cast<uInt>(bytes.size());
  // zlib counts its input in 32 bits; what does not fit must not be cut off silently.
  int result = Z_STREAM_ERROR;
  if (bytes.size() <= std::numeric_limits<uInt>::max()) {
    result =
        deflateInit2_(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, gzip ? kGzipWindowBits : kZlibWindowBits,
                      kMemoryLevel, Z_DEFAULT_STRATEGY, kZlibVersion, sizeof stream);
  }
  if (result != Z_OK) {
    logError("compressDataWithZlibOrGzip: deflateInit2() Error: \"%s\" Message: \"%s\"",
             textAtInitialisation(result), messageOf(stream));
    return std::nullopt;
  }
  std::string output(deflateBound(&stream, bytes.size()), '\0');
  result = deflateWhole(stream, output);
  if (result != Z_STREAM_END) {
    logError("compressDataWithZlibOrGzip: zlib error while attempting compression: \"%s\" Message: \"%s\"",
             textDuringCompression(result), messageOf(stream));
    deflateEnd(&stream);
    return std::nullopt;
  }
  const std::size_t produced = stream.total_out;
  deflateEnd(&stream);
  output.resize(produced);
  output.shrink_to_fit();  // it may wait long for a server, and bounds count its size
  logDebug("compressDataWithZlibOrGzip: Compressed file from %u to %u", static_cast<unsigned>(bytes.size()),
           static_cast<unsigned>(produced));
  return output;
}

std::optional<std::string> gzipDeflate(std::string_view bytes) {
  return compressDataWithZlibOrGzip(true, bytes);
}

}  // namespace veltrad
