// From the bytes of a container to the storebag; nobody vouches for the bytes.
#include "config/storebag_container.h"

#include <gtest/gtest.h>

#include <vector>

#include "base/base64.h"

namespace veltrad {
namespace {

TEST(StorebagContainer, IsReadInEitherForm) {
  const Dictionary dictionary{{"signature", "c2ln"}, {"bag", "YmFn"}, {"note", Array{1, 2}}};
  for (const std::string& bytes : {writeXMLPropertyList(dictionary), writeBinaryPropertyList(dictionary)}) {
    const auto container = parseStorebagContainer(bytes);
    ASSERT_TRUE(container);
    const auto decoded = decodeStorebagContainer(container.value());
    ASSERT_TRUE(decoded);
    EXPECT_EQ(decoded->signature, "sig");
    EXPECT_EQ(decoded->bag, "bag");
  }
}

TEST(StorebagContainer, TakesOnlyTexts) {
  const std::vector<Value> lists = {Array{"signature", "bag"}, "signature", Dictionary{},
                                    Dictionary{{"signature", Data{"sig"}}, {"bag", 7}}};
  for (const Value& list : lists) {
    const auto container = parseStorebagContainer(writeXMLPropertyList(list));
    ASSERT_TRUE(container);
    EXPECT_FALSE(container.value().signature);
    EXPECT_FALSE(container.value().bag);
    EXPECT_FALSE(decodeStorebagContainer(container.value()));
  }
}

TEST(StorebagContainer, DecodesBrokenLinesAndRefusesWhatIsNoBase64) {
  const std::string whole(200, 'b');
  for (const std::size_t width : {std::size_t{64}, std::size_t{76}}) {
    std::string text = encodeBase64(whole);
    for (std::size_t at = width; at < text.size(); at += width + 2) text.insert(at, "\r\n");
    const auto decoded = decodeStorebagContainer({" c2ln\n", text});
    ASSERT_TRUE(decoded);
    EXPECT_EQ(decoded->bag, whole);
  }
  EXPECT_FALSE(decodeStorebagContainer({"c2ln", "YmFn="}));
  EXPECT_FALSE(decodeStorebagContainer({"c", "YmFn"}));
  EXPECT_FALSE(decodeStorebagContainer({"c2ln", std::nullopt}));
  EXPECT_FALSE(decodeStorebagContainer({std::nullopt, "YmFn"}));
}

std::string nestedArrays(int depth) {
  std::string xml = "<plist version=\"1.0\">";
  for (int i = 0; i < depth; ++i) xml += "<array>";
  for (int i = 0; i < depth; ++i) xml += "</array>";
  return xml + "</plist>";
}

// 16 arrays, each holding the next one 16 times: some 200 bytes that stand for 16 to the 16th values.
std::string sharedArrays() {
  std::string bytes = "bplist00";
  std::string offsets;
  for (int i = 0; i < 16; ++i) {
    offsets += static_cast<char>(bytes.size() >> 8);
    offsets += static_cast<char>(bytes.size());
    if (i < 15) bytes += "\xaf\x10\x10" + std::string(16, static_cast<char>(i + 1));
  }
  bytes += '\x09';
  std::string trailer(32, '\0');
  trailer[6] = 2;
  trailer[7] = 1;
  trailer[15] = 16;
  trailer[30] = static_cast<char>(bytes.size() >> 8);
  trailer[31] = static_cast<char>(bytes.size());
  return bytes + offsets + trailer;
}

TEST(StorebagContainer, IsBoundedWhateverItsBytesSay) {
  using Kind = PropertyListError::Kind;
  Array many(2'000, Value(1));
  const std::vector<std::pair<std::string, Kind>> table = {
      {"", Kind::notAPropertyList},
      {"<html></html>", Kind::malformed},
      {nestedArrays(9), Kind::tooDeep},
      {nestedArrays(100'000), Kind::tooDeep},
      {sharedArrays(), Kind::tooDeep},
      {writeXMLPropertyList(many), Kind::tooLarge},
      {writeXMLPropertyList(Value(std::string(kStorebagMostContainerBytes, 'x'))), Kind::tooLarge},
  };
  for (const auto& [bytes, kind] : table) {
    const auto container = parseStorebagContainer(bytes);
    ASSERT_FALSE(container) << bytes.substr(0, 60);
    if (!bytes.starts_with("<html")) {  // how a foreign document is refused is the reader's choice
      EXPECT_EQ(container.error().kind, kind) << bytes.substr(0, 60) << ": " << container.error().detail;
    }
  }
}

TEST(StorebagBag, IsADictionaryWithinBounds) {
  EXPECT_EQ(parseStorebagBag(writeBinaryPropertyList(Dictionary{{"version", "1"}})),
            (Dictionary{{"version", "1"}}));
  EXPECT_FALSE(parseStorebagBag(writeBinaryPropertyList(Array{})));
  EXPECT_FALSE(parseStorebagBag("no property list"));
  EXPECT_FALSE(parseStorebagBag(nestedArrays(33)));
  EXPECT_FALSE(parseStorebagBag(sharedArrays()));
}

}  // namespace
}  // namespace veltrad
