// SPDX-License-Identifier: Apache-2.0
// Compression to a gzip stream (RFC 1952) on the caller's thread. Failures are logged here.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/mutex.h"

namespace veltrad::support {

class Deflation;

// Compresses texts. Keeps one stream of zlib (some 270 KB) and the part of 128 KiB of room for its output
// that was ever used, because memory that is taken from the system and returned for each text costs dozens of
// page faults. Any thread.
class GzipCompressor {
 public:
  GzipCompressor();
  ~GzipCompressor();

  // Compresses the pieces as one text. `level`: zlib's, 1 (fast) to 9 (small). Absent if there are no bytes,
  // memory is short or zlib fails.
  std::optional<std::string> gzipDeflate(const std::vector<std::string_view>& pieces, int level);
  // Frees the stream until the next text.
  void rest();

 private:
  std::optional<std::string> deflateAtOnce(const std::vector<std::string_view>& pieces, int level);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::unique_ptr<Deflation> _kept GUARDED_BY(_mutex);
};

// Writes the next bytes to `place`, at most `room`, and returns how many; 0 at the end. Absent after a
// failure, which it logs.
using ByteSource = std::function<std::optional<std::size_t>(char* place, std::size_t room)>;
// Takes the next bytes. False after a failure, which it logs.
using ByteSink = std::function<bool(std::string_view bytes)>;

// Compresses what `source` returns piece by piece, and passes the output to `sink`. False if any of them
// fails.
bool gzipDeflate(const ByteSource& source, const ByteSink& sink);

}  // namespace veltrad::support
