// SPDX-License-Identifier: Apache-2.0
// Texts: base64, UTF-8 at its borders, letter case beyond ASCII, log lines.
#include "base/text.h"

#include <gtest/gtest.h>

#include "base/base64.h"

namespace veltrad {
namespace {

using namespace std::literals;

TEST(Base64, goesBothWaysAndRefusesWhatIsNone) {
  for (const std::string row : {" ", "f Zg==", "fo Zm8=", "foo Zm9v", "foob Zm9vYg==", "\xFB\xFF\xBF +/+/"}) {
    const std::string bytes = row.substr(0, row.find(' ')), text = row.substr(row.find(' ') + 1);
    EXPECT_EQ(encodeBase64(bytes), text);
    EXPECT_EQ(decodeBase64(text), bytes);
  }
  EXPECT_EQ(decodeBase64("Zm\r\n9v-\tYg*=\n="), "foob");
  for (const char* text :
       {"Z", "Zg", "Zg=", "Zm9", "Zg===", "=", "====", "Z===", "Zm8==", "Zg==Zg==", "Zm8=Z", "Zm9v="})
    EXPECT_FALSE(decodeBase64(text)) << text;
}

TEST(Text, tellsUTF8AndMendsTheRest) {
  for (const char* good :
       {"", "text of more than eight bytes", "\u00e9\u0800\uD7FF\uE000\uFFFF\U00010000\U0010FFFF"}) {
    EXPECT_EQ(toUTF8(good), good);
    EXPECT_TRUE(isUTF8(good));
  }
  // Overlong ones, a surrogate, what is above U+10FFFF; each byte that is wrong, and how many are.
  for (const auto& [bytes, wrong] : {std::pair("\xC0\xAF", 2),
                                     {"\xE0\x9F\xBF", 3},
                                     {"\xF0\x8F\xBF\xBF", 4},
                                     {"\xED\xA0\x80", 3},
                                     {"\xF4\x90\x80\x80", 4},
                                     {"\x80", 1},
                                     {"\xE2\x98", 2}}) {
    std::string mended = "12345678";
    for (int i = 0; i < wrong; ++i) mended += "\uFFFD";
    EXPECT_EQ(toUTF8("12345678"s + bytes), mended);
    EXPECT_EQ(toUTF8("12345678"s + bytes + "g"), mended + "g");
    EXPECT_FALSE(isUTF8(bytes));
  }
}

TEST(Text, losesAnIncompleteEndAlone) {
  for (const char* end : {"\xE2\x98", "\xE2", "\xF0\x9F\x98"})
    EXPECT_EQ(withoutIncompleteEnd("a"s + end), "a");
  for (const char* whole : {"", "ab", "a\u2603", "a\x80", "a\xFF", "\x80\x80\x80\x80", "a\xED\xA0"})
    EXPECT_EQ(withoutIncompleteEnd(whole), whole);
}

TEST(Text, ignoresCaseByUnicode) {
  EXPECT_EQ(lowerCase("AbZ[@ \u00C9\u0416\u1E9E\xFF"), "abz[@ \u00E9\u0436\u00DF\xFF");
  EXPECT_TRUE(equalIgnoringCase("\u0416UK", "\u0436uk") && !equalIgnoringCase("a", "ab"));
  EXPECT_TRUE(containsIgnoringCase("Some \u00C9T\u00C9 here", "\u00E9t\u00E9") &&
              containsIgnoringCase("x", ""));
  EXPECT_FALSE(containsIgnoringCase("abc", "d"));
}

}  // namespace
}  // namespace veltrad
