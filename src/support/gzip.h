// Compression of whole buffers with zlib's deflate. Pure functions but for their log lines; any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace veltrad {

// The gzip stream (RFC 1952) of `bytes`; nothing, after an error line, where there are none or zlib fails.
std::optional<std::string> gzipDeflate(std::string_view bytes);

// The same with the wrapper chosen: gzip (true) or zlib's own (false, RFC 1950).
std::optional<std::string> compressDataWithZlibOrGzip(bool gzip, std::string_view bytes);

}  // namespace veltrad
