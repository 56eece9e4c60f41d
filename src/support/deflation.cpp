// Set-up, failures and their texts. One thread at a time.
#include "support/deflation.h"

#include "platform/log.h"

namespace veltrad::support {

namespace {

// The oldest version whose streams are known to be read.
constexpr const char* kZlibVersion = "1.2.8";
constexpr int kMemoryLevel = 8;
constexpr int kWindowBits = 15;
constexpr int kGzipWrapper = 16;  // added: a gzip header and trailer in place of zlib's

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

const char* shown(const char* message) {
  return message != nullptr ? message : "(null)";
}

int windowBits(Deflation::Wrapper wrapper) {
  return wrapper == Deflation::Wrapper::gzip ? kWindowBits + kGzipWrapper : kWindowBits;
}

}  // namespace

Deflation::~Deflation() {
  if (_begun) deflateEnd(&_stream);
}

bool Deflation::begin(Wrapper wrapper) {
  const int result = deflateInit2_(&_stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, windowBits(wrapper),
                                   kMemoryLevel, Z_DEFAULT_STRATEGY, kZlibVersion, sizeof _stream);
  _begun = result == Z_OK;
  if (!_begun) {
    logError("compressDataWithZlibOrGzip: deflateInit2() Error: \"%s\" Message: \"%s\"",
             textAtInitialisation(result), shown(_stream.msg));
  }
  return _begun;
}

bool Deflation::append(int flush, std::string& buffer, const ByteSink& sink) {
  int result = Z_OK;
  do {
    _stream.next_out = reinterpret_cast<Bytef*>(buffer.data());
    _stream.avail_out = static_cast<uInt>(buffer.size());
    result = deflate(&_stream, flush);
    const std::size_t made = buffer.size() - _stream.avail_out;
    if (made > 0 && !sink(std::string_view(buffer).substr(0, made))) return false;
  } while (result == Z_OK && _stream.avail_out == 0);
  const bool nothingToDo = result == Z_BUF_ERROR && flush != Z_FINISH;
  return nothingToDo || !failed(result);
}

bool Deflation::failed(int result) const {
  if (result == Z_OK || result == Z_STREAM_END) return false;
  logError("compressDataWithZlibOrGzip: zlib error while attempting compression: \"%s\" Message: \"%s\"",
           textDuringCompression(result), shown(_stream.msg));
  return true;
}

}  // namespace veltrad::support
