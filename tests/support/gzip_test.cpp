// Compression, read back with zlib's inflate.
#include "support/gzip.h"

#include <gtest/gtest.h>
#include <zlib.h>

#include <random>

#include "fakes/recorded_log.h"

namespace veltrad {
namespace {

// `windowBits` as inflateInit2 takes it: 31 accepts the gzip wrapper alone, 15 zlib's alone. Empty when it is
// broken or not the one stream of `length` bytes.
std::string inflated(const std::string& compressed, std::size_t length, int windowBits) {
  z_stream stream{};
  std::string output(length, '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  stream.next_out = reinterpret_cast<Bytef*>(output.data());
  stream.avail_out = static_cast<uInt>(length);
  const bool whole = inflateInit2(&stream, windowBits) == Z_OK &&
                     inflate(&stream, Z_FINISH) == Z_STREAM_END && stream.avail_in == 0 &&
                     stream.avail_out == 0;
  inflateEnd(&stream);
  return whole ? output : std::string();
}

TEST(Gzip, GivesBackWhatWentIn) {
  RecordedLog log;
  std::mt19937 random(7);
  std::string noise(3u << 20, '\0');  // does not shrink: needs the whole bound
  for (char& c : noise) c = static_cast<char>(random());
  for (const std::string& input :
       {std::string("x"), std::string(1, '\0'), std::string(1'000'000, 'a'), noise}) {
    const auto gzip = gzipDeflate(input), zlib = compressDataWithZlibOrGzip(false, input);
    ASSERT_TRUE(gzip && zlib);
    EXPECT_TRUE(inflated(*gzip, input.size(), 31) == input && inflated(*gzip, input.size(), 15).empty());
    EXPECT_TRUE(inflated(*zlib, input.size(), 15) == input && inflated(*zlib, input.size(), 31).empty());
    EXPECT_LT(gzip->capacity(), gzip->size() + 64);  // no worst-case buffer stays behind
  }
  EXPECT_FALSE(gzipDeflate(""));
  log.expectLine(platform::LogLevel::error, "compressDataWithZlibOrGzip: Cannot compress empty Torvane");
  log.expectLine(platform::LogLevel::debug, "compressDataWithZlibOrGzip: Compressed file from 1 to ");
}

}  // namespace
}  // namespace veltrad
