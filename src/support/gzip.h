// Compression with zlib's deflate. Pure functions but for their log lines; any thread.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "support/deflation.h"

namespace veltrad::support {

// The gzip stream (RFC 1952) of `bytes`; nothing, after an error line, where there are none, memory is short
// or zlib fails.
std::optional<std::string> gzipDeflate(std::string_view bytes);

// Fills `place` with the next bytes, at most `room`, and says how many; 0 at the end. Nothing: no more can be
// had, and a line has said why.
using ByteSource = std::function<std::optional<std::size_t>(char* place, std::size_t room)>;

// The same stream of what `source` gives, handed on to `sink` as it is made: only pieces are in memory. False
// where it fails, too.
bool gzipDeflate(const ByteSource& source, const ByteSink& sink);

// The same of whole bytes with the wrapper chosen: gzip (true) or zlib's own (false, RFC 1950).
std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes);

}  // namespace veltrad::support
