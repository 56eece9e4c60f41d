// Compression, read back with zlib's inflate.
#include "support/gzip.h"

#include <gtest/gtest.h>
#include <zlib.h>

#include <random>
#include <vector>

#include "platform/log.h"

namespace veltrad {
namespace {

// `windowBits` as inflateInit2 takes it: 31 accepts the gzip wrapper alone, 15 zlib's alone. Empty when it is
// broken.
std::string inflated(const std::string& compressed, int windowBits) {
  z_stream stream{};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  if (inflateInit2(&stream, windowBits) != Z_OK) return {};
  std::string output;
  std::string part(1 << 16, '\0');
  int result = Z_OK;
  while (result == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(part.data());
    stream.avail_out = static_cast<uInt>(part.size());
    result = inflate(&stream, Z_NO_FLUSH);
    output.append(part, 0, part.size() - stream.avail_out);
  }
  const bool whole = result == Z_STREAM_END && stream.avail_in == 0;
  inflateEnd(&stream);
  return whole ? output : std::string();
}

std::vector<std::string> inputs() {
  std::mt19937 random(7);
  std::string noise(3u << 20, '\0');  // does not shrink: needs the whole bound
  for (char& c : noise) c = static_cast<char>(random());
  return {"x", std::string(1, '\0'), std::string(1'000'000, 'a'), noise, R"({"events":[{"name":"start"}]})"};
}

TEST(Gzip, GivesBackWhatWentIn) {
  for (const std::string& input : inputs()) {
    const auto gzip = gzipDeflate(input);
    ASSERT_TRUE(gzip);
    EXPECT_EQ(gzip->substr(0, 3), "\x1f\x8b\x08");
    EXPECT_TRUE(inflated(*gzip, 31) == input);
    EXPECT_TRUE(inflated(*gzip, 15).empty());
    EXPECT_LT(gzip->capacity(), gzip->size() + 64);  // no worst-case buffer stays behind

    const auto zlib = compressDataWithZlibOrGzip(false, input);
    ASSERT_TRUE(zlib);
    EXPECT_TRUE(inflated(*zlib, 15) == input);
    EXPECT_TRUE(inflated(*zlib, 31).empty());
  }
}

TEST(Gzip, SaysWhatItDid) {
  std::vector<std::string> lines;
  platform::log::threshold = static_cast<int>(platform::LogLevel::debug);
  platform::log::setSink([&](platform::LogLevel level, std::string_view line) {
    lines.push_back(std::to_string(static_cast<int>(level)) + " " + std::string(line));
  });
  EXPECT_FALSE(gzipDeflate(""));
  const auto compressed = gzipDeflate("x");
  platform::log::setSink({});
  ASSERT_TRUE(compressed);
  EXPECT_EQ(lines, (std::vector<std::string>{"3 compressDataWithZlibOrGzip: Cannot compress empty Torvane",
                                             "7 compressDataWithZlibOrGzip: Compressed file from 1 to " +
                                                 std::to_string(compressed->size())}));
}

}  // namespace
}  // namespace veltrad
