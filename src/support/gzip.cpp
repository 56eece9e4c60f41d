// SPDX-License-Identifier: Apache-2.0
// Compresses with zlib's deflate in one pass over the input.
#include "support/gzip.h"

#include <zlib.h>

#include <limits>
#include <new>

#include "platform/log.h"

namespace veltrad::support {
namespace {

constexpr std::size_t kPieceBytes = 128u << 10;
constexpr std::size_t kMostAtOnce = std::numeric_limits<int>::max();  // zlib's sizes have 32 bits
// The oldest version of zlib that is accepted.
constexpr const char* kZlibVersion = "1.2.8";
constexpr int kMemoryLevel = 8;
// The largest window, with a gzip header and trailer.
constexpr int kGzipWindowBits = 15 + 16;

struct FailureText {
  int result;
  const char* atInitialisation;
  const char* duringCompression;
};
constexpr const char* kUnknown = "Unknown error code.";
constexpr FailureText kTexts[] = {
    {Z_VERSION_ERROR, "The version of zlib.h and the version of the library linked do not match.",
     "The version of zlib.h and the version of the library linked do not match."},
    {Z_BUF_ERROR, kUnknown, "Ran out of output buffer for writing compressed bytes."},
    {Z_MEM_ERROR, "Insufficient memory.", "Memory could not be allocated for processing."},
    {Z_DATA_ERROR, kUnknown, "The deflate data was invalid or incomplete."},
    {Z_STREAM_ERROR, "Invalid parameter passed in to function.",
     "The stream state was inconsistent (e.g., next_in or next_out was NULL)."},
    {Z_ERRNO, kUnknown, "Error occured while reading file."}};

const char* failureText(int result, const char* FailureText::*when) {
  for (const FailureText& text : kTexts) {
    if (text.result == result) return text.*when;
  }
  return kUnknown;
}

const char* shown(const char* message) {
  return message != nullptr ? message : "(null)";
}

}  // namespace

// A deflate stream.
class Deflation {
 public:
  explicit Deflation(int level) : level(level) {}
  ~Deflation() {
    if (_begun) deflateEnd(&stream);
  }
  Deflation(const Deflation&) = delete;
  Deflation& operator=(const Deflation&) = delete;

  bool begin() {
    const int result = deflateInit2_(&stream, level, Z_DEFLATED, kGzipWindowBits, kMemoryLevel,
                                     Z_DEFAULT_STRATEGY, kZlibVersion, sizeof stream);
    _begun = result == Z_OK;
    if (!_begun) {
      logError("compressDataWithZlibOrGzip: deflateInit2() Error: \"%s\" Message: \"%s\"",
               failureText(result, &FailureText::atInitialisation), shown(stream.msg));
    }
    return _begun;
  }
  // Makes a used stream as good as new.
  bool beginAnew() { return deflateReset(&stream) == Z_OK; }
  void give(const char* bytes, std::size_t count) {
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(bytes));  // zlib only reads them
    stream.avail_in = static_cast<uInt>(count);
  }
  void emptyRoom() {
    stream.next_out = reinterpret_cast<Bytef*>(_room.get());
    stream.avail_out = static_cast<uInt>(kPieceBytes);
  }
  // Writes to what is left of the room and returns the result of deflate().
  int run(int flush) { return deflate(&stream, flush); }
  bool full() const { return stream.avail_out == 0; }
  // The output in the buffer.
  std::string_view made() const { return {_room.get(), kPieceBytes - stream.avail_out}; }
  void sayFailure(int result) const {
    logError("compressDataWithZlibOrGzip: zlib error while attempting compression: \"%s\" Message: \"%s\"",
             failureText(result, &FailureText::duringCompression), shown(stream.msg));
  }

  const int level;
  z_stream stream{};

 private:
  bool _begun = false;
  // Without initial content, which would touch every page.
  const std::unique_ptr<char[]> _room{new char[kPieceBytes]};
};

namespace {

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

// Passes the output to `sink`.
bool append(Deflation& deflation, int flush, const ByteSink& sink) {
  int result = Z_OK;
  do {
    deflation.emptyRoom();
    result = deflation.run(flush);
    if (!deflation.made().empty() && !sink(deflation.made())) return false;
  } while (result == Z_OK && deflation.full());
  const bool nothingToDo = result == Z_BUF_ERROR && flush != Z_FINISH;
  if (result == Z_OK || result == Z_STREAM_END || nothingToDo) return true;
  deflation.sayFailure(result);
  return false;
}

bool deflatePieces(const ByteSource& source, const ByteSink& sink) {
  Deflation deflation(Z_DEFAULT_COMPRESSION);
  if (!deflation.begin()) return false;
  std::string piece(kPieceBytes, '\0');
  std::size_t taken = 0;
  std::optional<std::size_t> count;
  do {
    count = source(piece.data(), piece.size());
    if (!count) return false;
    taken += *count;
    if (taken == 0) {
      sayEmpty();
      return false;
    }
    deflation.give(piece.data(), *count);
    if (!append(deflation, *count == 0 ? Z_FINISH : Z_NO_FLUSH, sink)) return false;
  } while (*count > 0);
  sayCompressed(taken, deflation.stream.total_out);
  return true;
}

}  // namespace

GzipCompressor::GzipCompressor() = default;
GzipCompressor::~GzipCompressor() = default;

void GzipCompressor::rest() {
  std::unique_ptr<Deflation> kept;
  const Lock held(_mutex);
  kept.swap(_kept);
}

std::optional<std::string> GzipCompressor::deflateAtOnce(const std::vector<std::string_view>& pieces,
                                                         int level) {
  std::unique_ptr<Deflation> taken;
  {
    const Lock held(_mutex);
    taken.swap(_kept);
  }
  if (!taken || taken->level != level || !taken->beginAnew()) {
    taken = std::make_unique<Deflation>(level);
    if (!taken->begin()) return std::nullopt;
  }
  Deflation& deflation = *taken;
  std::string output;
  const ByteSink sink = [&output](std::string_view bytes) {
    output.append(bytes);
    return true;
  };
  for (std::size_t i = 0; i < pieces.size(); ++i) {
    deflation.give(pieces[i].data(), pieces[i].size());
    if (!append(deflation, i + 1 == pieces.size() ? Z_FINISH : Z_NO_FLUSH, sink)) return std::nullopt;
  }
  output.shrink_to_fit();  // it may wait for a server for a long time
  sayCompressed(deflation.stream.total_in, output.size());
  const Lock held(_mutex);
  _kept.swap(taken);
  return output;
}

std::optional<std::string> GzipCompressor::gzipDeflate(const std::vector<std::string_view>& pieces,
                                                       int level) {
  std::size_t bytes = 0;
  for (const std::string_view piece : pieces) bytes += piece.size();
  if (bytes == 0) {
    sayEmpty();
    return std::nullopt;
  }
  if (bytes > kMostAtOnce) {
    logError("compressDataWithZlibOrGzip: Cannot compress %zu bytes: at most %zu", bytes, kMostAtOnce);
    return std::nullopt;
  }
  try {
    return deflateAtOnce(pieces, level);
  } catch (const std::bad_alloc&) {
    sayNoMemory();
    return std::nullopt;
  }
}

bool gzipDeflate(const ByteSource& source, const ByteSink& sink) {
  try {
    return deflatePieces(source, sink);
  } catch (const std::bad_alloc&) {
    sayNoMemory();
    return false;
  }
}

}  // namespace veltrad::support
