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
  const auto bag = [](int more) {
    return writeBinaryPropertyList(
        Dictionary{{"x", Array(static_cast<std::size_t>(65'534 + more), Value(1))}});
  };
  EXPECT_TRUE(parseStorebagBag(bag(-1)));
  EXPECT_FALSE(parseStorebagBag(bag(1)));
  for (const std::string& bytes : {writeXMLPropertyList(Array{}), std::string("no list"), nestedArrays(33)})
    EXPECT_FALSE(parseStorebagBag(bytes)) << bytes.substr(0, 60);
}

}  // namespace
}  // namespace veltrad
