// SPDX-License-Identifier: Apache-2.0
// The meaning of KEY=VALUE on veltractl's command line.
#include <gtest/gtest.h>

#include "formats/json.h"
#include "tools/key_value.h"

namespace veltrad::tools {
namespace {

TEST(KeyValue, numbersAndBooleansAreToldFromTexts) {
  Array found;
  for (const char* text : {"12", "-3", "-0.5", "1e3", "18446744073709551615", "true", "false"})
    found.push_back(parseKeyValue(std::string("k=") + text).value().second);
  EXPECT_EQ(formats::writeJSON(found), "[12,-3,-0.5,1000.0,18446744073709551615,true,false]");
  for (const char* text :
       {"True", "007", "+5", " 5", "1.", "8.0.1", "-", "", "a=b", "null", "{}", "NaN", "0x10"})
    EXPECT_EQ(parseKeyValue(std::string("k=") + text).value(), Dictionary::Entry("k", text));
  EXPECT_EQ(parseKeyValues({"a=1", "b=2", "a=3"}).value(), Dictionary({{"a", 3}, {"b", 2}}));
  for (const char* text : {"", "k", "=v", "k=\xff"}) EXPECT_FALSE(parseKeyValue(text).ok()) << text;
}

}  // namespace
}  // namespace veltrad::tools
