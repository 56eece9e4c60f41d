// The bounds within which containers and bags are read; what is in them is the download's tests.
#include "config/storebag_container.h"

#include <gtest/gtest.h>

#include <utility>

namespace veltrad {
namespace {

std::string nestedArrays(int depth) {
  std::string xml = "<plist version=\"1.0\">";
  for (int i = 0; i < depth; ++i) xml += "<array>";
  for (int i = 0; i < depth; ++i) xml += "</array>";
  return xml + "</plist>";
}

// Hostile lists are the codecs' tests; here it is that these bounds are the ones in force.
TEST(StorebagContainer, IsReadWithinItsOwnBounds) {
  using Kind = PropertyListError::Kind;
  const std::pair<std::string, Kind> table[] = {
      {"", Kind::notAPropertyList},
      {nestedArrays(9), Kind::tooDeep},
      {writeXMLPropertyList(Array(1'001, Value(1))), Kind::tooLarge},
      {writeXMLPropertyList(Value(std::string(kStorebagMostContainerBytes, 'x'))), Kind::tooLarge},
  };
  for (const auto& [bytes, kind] : table) {
    const auto container = parseStorebagContainer(bytes);
    ASSERT_FALSE(container) << bytes.substr(0, 60);
    EXPECT_EQ(container.error().kind, kind) << bytes.substr(0, 60) << ": " << container.error().detail;
  }
  Dictionary bag;
  for (int depth = 1; depth < kStorebagBagLimits.depth; ++depth) bag = Dictionary{{"deeper", bag}};
  EXPECT_EQ(parseStorebagBag(writeBinaryPropertyList(bag)), bag);
  EXPECT_FALSE(parseStorebagBag(writeBinaryPropertyList(Dictionary{{"deeper", bag}})));
  for (const std::string& bytes : {writeXMLPropertyList(Array{}), std::string("no list")})
    EXPECT_FALSE(parseStorebagBag(bytes));
}

}  // namespace
}  // namespace veltrad
