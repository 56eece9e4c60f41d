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

// Piece by piece: the same bytes up to a size, one stream by two threads beyond it.
TEST(Gzip, OfASourceIsOneStream) {
  RecordedLog log;
  std::mt19937 random(11);
  std::string large(5u << 20, '\0');  // ten blocks and an empty one
  for (char& c : large) c = "0123456789abcdef\n "[random() % 18];
  const auto packed = [](std::string_view rest, std::size_t piece, std::size_t failingAt = 0) {
    const std::size_t size = rest.size();
    const ByteSource source = [=](char* place, std::size_t room) mutable -> std::optional<std::size_t> {
      if (failingAt > 0 && rest.size() <= size - failingAt) return std::nullopt;
      const std::size_t count = rest.copy(place, std::min(room, piece));
      rest.remove_prefix(count);
      return count;
    };
    return gzipDeflate(source, size);
  };
  const std::string_view small = std::string_view(large).substr(0, 1'000'000);
  EXPECT_EQ(packed(small, 12'345), gzipDeflate(small));
  for (const std::size_t size : {large.size(), large.size() - 1}) {
    const std::string_view input = std::string_view(large).substr(0, size);
    const auto stream = packed(input, 99'999);
    ASSERT_TRUE(stream);
    EXPECT_TRUE(inflated(*stream, size, 31) == input);
    EXPECT_EQ(stream->substr(0, 10), gzipDeflate("x")->substr(0, 10));
    EXPECT_LT(stream->size(), gzipDeflate(input)->size() * 101 / 100);
  }
  EXPECT_FALSE(packed(large, 99'999, 3u << 20) || packed(small, 99'999, 500'000));
  EXPECT_FALSE(packed("", 1));
  log.expectLine(platform::LogLevel::error, "compressDataWithZlibOrGzip: Cannot compress empty Torvane");
}

}  // namespace
}  // namespace veltrad
