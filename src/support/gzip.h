// Compression of whole buffers with zlib's deflate. Pure functions but for their log lines; any thread.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace veltrad {

// The gzip stream (RFC 1952) of `bytes`; nothing, after an error line, where there are none or zlib fails.
std::optional<std::string> gzipDeflate(std::string_view bytes);

// Fills `place` with the next bytes, at most `room`, and says how many; 0 at the end. Nothing: no more can be
// had, and a line has said why. Called by one thread at a time.
using ByteSource = std::function<std::optional<std::size_t>(char* place, std::size_t room)>;

// The same of what `source` gives, of which only pieces are in memory: `expected` bytes, or what there is.
// Nothing, too, where it fails or memory is short. Many bytes are compressed by two threads: one gzip stream
// all the same, though of other bytes.
std::optional<std::string> gzipDeflate(const ByteSource& source, std::size_t expected);

// The same with the wrapper chosen: gzip (true) or zlib's own (false, RFC 1950).
std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes);

}  // namespace veltrad
