// Base64 against the vectors of RFC 4648 and the ways in which a text can be wrong.
#include "base/base64.h"

#include <gtest/gtest.h>

namespace veltrad {
namespace {

TEST(Base64, goesBothWays) {
  const std::pair<std::string, std::string> kVectors[] = {{"", ""},
                                                          {"f", "Zg=="},
                                                          {"fo", "Zm8="},
                                                          {"foo", "Zm9v"},
                                                          {"foob", "Zm9vYg=="},
                                                          {"fooba", "Zm9vYmE="},
                                                          {"\xFB\xFF\xBF", "+/+/"}};
  for (const auto& [bytes, text] : kVectors) {
    EXPECT_EQ(encodeBase64(bytes), text);
    EXPECT_EQ(decodeBase64(text), bytes);
  }
  EXPECT_EQ(decodeBase64("Zm\r\n9v-\tYg*=\n="), "foob");
}

TEST(Base64, refusesWhatIsNone) {
  for (const char* text :
       {"Z", "Zg", "Zg=", "Zm9", "Zg===", "=", "====", "Z===", "Zm8==", "Zg==Zg==", "Zm8=Z", "Zm9v="}) {
    EXPECT_FALSE(decodeBase64(text)) << text;
  }
}

}  // namespace
}  // namespace veltrad
