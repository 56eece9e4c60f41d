// Compression, read back with zlib's inflate.
#include "support/gzip.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
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

// Piece by piece: the same stream, and the end of either side is the end.
TEST(Gzip, OfASourceIsTheSameStream) {
  RecordedLog log;
  std::mt19937 random(11);
  std::string large(1u << 20, '\0');
  for (char& c : large) c = "0123456789abcdef\n "[random() % 18];
  const auto packed = [](std::string_view rest, std::size_t failingAt = SIZE_MAX,
                         std::size_t room = SIZE_MAX) {
    const std::size_t size = rest.size();
    std::string output;
    const ByteSource source = [=](char* place, std::size_t most) mutable -> std::optional<std::size_t> {
      if (size - rest.size() >= failingAt) return std::nullopt;
      const std::size_t count = rest.copy(place, std::min<std::size_t>(most, 12'345));
      rest.remove_prefix(count);
      return count;
    };
    const bool done = gzipDeflate(source, [&](std::string_view bytes) {
      if (output.size() + bytes.size() > room) return false;
      output += bytes;
      return true;
    });
    return done ? std::optional(output) : std::nullopt;
  };
  EXPECT_EQ(packed(large), gzipDeflate(large));
  EXPECT_FALSE(packed(large, 500'000) || packed(large, SIZE_MAX, 300'000));
  EXPECT_FALSE(packed(""));
  log.expectLine(platform::LogLevel::error, "compressDataWithZlibOrGzip: Cannot compress empty Torvane");
}

// No page of it is touched: too many bytes are refused by their number.
TEST(Gzip, SaysTheBoundWithoutNamingZlib) {
  RecordedLog log;
  constexpr std::size_t kTooMany = std::size_t{1} << 32;
  void* const none = ::mmap(nullptr, kTooMany, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
  ASSERT_NE(none, MAP_FAILED);
  EXPECT_FALSE(gzipDeflate(std::string_view(static_cast<const char*>(none), kTooMany)));
  ::munmap(none, kTooMany);
  log.expectLine(platform::LogLevel::error,
                 "compressDataWithZlibOrGzip: Cannot compress 4294967296 bytes: at most 4294967295");
}

}  // namespace
}  // namespace veltrad
