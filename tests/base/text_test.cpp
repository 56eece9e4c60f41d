// UTF-8 at its borders, letter case beyond ASCII, log lines.
#include "base/text.h"

#include <gtest/gtest.h>

namespace veltrad {
namespace {

using namespace std::literals;

TEST(Text, tellsUTF8AndMendsTheRest) {
  const std::pair<std::string, std::string> kCases[] = {
      {"", ""},
      {"plain text of more than eight bytes", "plain text of more than eight bytes"},
      {"\u00e9\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF",
       "\u00e9\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF"},
      {"\xC0\xAF", "\uFFFD\uFFFD"},                      // overlong
      {"\xE0\x9F\xBF", "\uFFFD\uFFFD\uFFFD"},            // overlong
      {"\xF0\x8F\xBF\xBF", "\uFFFD\uFFFD\uFFFD\uFFFD"},  // overlong
      {"\xED\xA0\x80", "\uFFFD\uFFFD\uFFFD"},            // surrogate
      {"\xF4\x90\x80\x80", "\uFFFD\uFFFD\uFFFD\uFFFD"},  // above U+10FFFF
      {"a\x80g", "a\uFFFDg"},
      {"12345678\xFF", "12345678\uFFFD"},
      {"cut \xE2\x98", "cut \uFFFD\uFFFD"}};
  for (const auto& [bytes, mended] : kCases) {
    EXPECT_EQ(toUTF8(bytes), mended);
    EXPECT_EQ(isUTF8(bytes), bytes == mended) << bytes;
  }
}

TEST(Text, losesAnIncompleteEndAlone) {
  const std::pair<std::string, std::string> kCases[] = {{"", ""},
                                                        {"ab", "ab"},
                                                        {"a\u2603", "a\u2603"},
                                                        {"a\xE2\x98", "a"},
                                                        {"a\xE2", "a"},
                                                        {"a\xF0\x9F\x98", "a"},
                                                        {"a\x80", "a\x80"},
                                                        {"a\xFF", "a\xFF"},
                                                        {"\x80\x80\x80\x80", "\x80\x80\x80\x80"},
                                                        {"a\xED\xA0", "a\xED\xA0"}};
  for (const auto& [text, kept] : kCases) EXPECT_EQ(withoutIncompleteEnd(text), kept);
}

TEST(Text, ignoresCaseByUnicode) {
  EXPECT_EQ(lowerCase("AbZ[@ \u00C9\u0416\u1E9E\xFF"), "abz[@ \u00E9\u0436\u00DF\xFF");
  EXPECT_TRUE(equalIgnoringCase("\u0416UK", "\u0436uk"));
  EXPECT_FALSE(equalIgnoringCase("a", "ab"));
  EXPECT_TRUE(containsIgnoringCase("Some \u00C9T\u00C9 here", "\u00E9t\u00E9"));
  EXPECT_TRUE(containsIgnoringCase("x", ""));
  EXPECT_FALSE(containsIgnoringCase("abc", "d"));
}

TEST(Text, escapesLogLines) {
  EXPECT_EQ(escapedForLog("a\\b\n\x1B[1m\x7F \u00e9 \u0085\u2028\xFF"s),
            "a\\\\b\\x0A\\x1B[1m\\x7F \u00e9 \\xC2\\x85\\xE2\\x80\\xA8\\xFF");
}

}  // namespace
}  // namespace veltrad
