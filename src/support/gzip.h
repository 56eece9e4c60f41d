// Compression to a gzip stream (RFC 1952) on the caller's thread. Failures are logged here.
#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace veltrad::support {

// Absent if there are no bytes, memory is short or zlib fails.
std::optional<std::string> gzipDeflate(std::string_view bytes);

// Writes the next bytes to `place`, at most `room`, and returns how many; 0 at the end. Absent after a
// failure, which it logs.
using ByteSource = std::function<std::optional<std::size_t>(char* place, std::size_t room)>;
// Takes the next bytes. False after a failure, which it logs.
using ByteSink = std::function<bool(std::string_view bytes)>;

// Compresses what `source` returns piece by piece, and passes the output to `sink`. False if any of them
// fails.
bool gzipDeflate(const ByteSource& source, const ByteSink& sink);

}  // namespace veltrad::support
