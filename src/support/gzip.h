// Compression to a gzip stream (RFC 1952), by the caller's thread alone. What goes wrong is one error line,
// here and nowhere else.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace veltrad::support {

// Nothing: there are no bytes, memory is short or zlib fails.
std::optional<std::string> gzipDeflate(std::string_view bytes);

// Fills `place` with the next bytes, at most `room`, and says how many; 0 at the end. Nothing: no more can be
// had, and a line has said why.
using ByteSource = std::function<std::optional<std::size_t>(char* place, std::size_t room)>;
// Takes the next bytes of an output. False: it can take no more, and a line has said why.
using ByteSink = std::function<bool(std::string_view bytes)>;

// The stream of what `source` gives, handed on to `sink` as it is made: only pieces are in memory. False
// where it fails, too.
bool gzipDeflate(const ByteSource& source, const ByteSink& sink);

}  // namespace veltrad::support
