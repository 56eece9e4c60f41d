// SPDX-License-Identifier: Apache-2.0
// XML property lists: every element, what is written, what is refused and where.
#include <gtest/gtest.h>

#include <cmath>

#include "formats/property_list.h"

namespace veltrad {
namespace {

using namespace std::literals;
using Kind = PropertyListError::Kind;

std::string plist(const std::string& inside) {
  return "<plist version=\"1.0\">" + inside + "</plist>";
}

std::string utf16(const std::string& ascii) {
  std::string wide = "\xFF\xFE";
  for (const char c : ascii) wide += {c, '\0'};
  return wide;
}

TEST(XMLPropertyList, readsEveryElement) {
  const std::pair<std::string, Value> kCases[] = {
      {"<true/>", true},
      {"<false> </false>", false},
      {"<integer> -12\n</integer>", -12},
      {"<integer>+0xfF</integer>", 255},
      {"<integer>-9223372036854775808</integer>", INT64_MIN},
      {"<integer>18446744073709551615</integer>", UINT64_MAX},
      {"<real>+1.5e3</real>", 1500.0},
      {"<real>12</real>", 12.0},
      {"<real>-Infinity</real>", -HUGE_VAL},
      {"<real>+inf</real>", HUGE_VAL},
      {"<date>2024-02-29T12:00:01Z</date>", Date{1709208001}},
      {"<date>0001-01-01T00:00:00Z</date>", Date{-62135596800}},
      {"<data>\n\tAAEC\n\tAw==\n</data>", Data{"\0\1\2\3"s}},
      {"<data/>", Data{""}},
      {"<string> a &amp; &#x263A;<!-- not this --><![CDATA[<b>]]></string>", " a & \u263A<b>"},
      {"<string></string>", ""},
      {"<array><array/>\n<dict/></array>", Array{Array{}, Dictionary{}}},
      {"<dict><key>b</key><integer>1</integer><key>a</key><string>x</string><key>b</key><true/></dict>",
       Dictionary{{"a", "x"}, {"b", true}}}};
  for (const auto& [inside, value] : kCases) {
    for (const std::string& list :
         {plist(inside), utf16(plist(inside)),
          "\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC \"-//X//DTD//EN\" "
          "\"https://host.invalid/x.dtd\">\n<?what ever?>" +
              plist(inside) + "\n"}) {
      const auto read = formats::parsePropertyList(list);
      ASSERT_TRUE(read.ok()) << inside << ": " << read.error().detail;
      EXPECT_TRUE(read.value() == value) << inside;
    }
  }
  EXPECT_TRUE(std::isnan(*formats::parsePropertyList(plist("<real>nan</real>")).value().asReal()));
}

TEST(XMLPropertyList, refusesWhatIsNone) {
  const auto expectRefusal = [](const std::string& list, Kind kind, const std::string& detail) {
    const auto read = formats::parsePropertyList(list);
    ASSERT_FALSE(read.ok()) << list;
    EXPECT_EQ(read.error().kind, kind) << list << ": " << read.error().detail;
    EXPECT_NE(read.error().description().find(detail), std::string::npos)
        << list << ": " << read.error().detail;
  };
  for (const char* other : {"", "{\"a\": 1}", "{ a = 1; }"})
    expectRefusal(other, Kind::notAPropertyList, "XML");
  expectRefusal("<html><body/></html>", Kind::notAPropertyList, "<html> where <plist>");
  expectRefusal("<plist version=\"2.0\"><true/></plist>", Kind::malformed, "version \"2.0\"");
  expectRefusal("<!DOCTYPE plist [<!ENTITY a \"b\">]>" + plist("<string>&a;</string>"), Kind::forbidden,
                "internal subset");
  expectRefusal("<!DOCTYPE plist SYSTEM \"x.dtd\">" + plist("<string>&a;</string>"), Kind::forbidden,
                "entity \"a\"");
  // What stands in the list, and a part of what is said of it.
  const std::pair<const char*, std::vector<const char*>> lists[] = {
      {"no value", {""}},
      {"second value", {"<true/><true/>"}},
      {"line 3", {"\n<array>\n<true/>"}},
      {"text between", {"text<true/>"}},
      {"unknown element <null>", {"<null/>"}},
      {"unknown element <plist>", {"<plist/>"}},
      {"key where a value", {"<key>a</key>", "<dict><key>a</key><key>b</key></dict>"}},
      {"inside a text", {"<string><true/></string>"}},
      {"value without a key", {"<dict><true/></dict>"}},
      {"no value for the key \"a\"", {"<dict><key>a</key></dict>"}},
      {"empty element", {"<true>no</true>"}},
      {"line 1", {"<string>\xC0\xAF</string>", "<string>&none;</string>"}}};
  for (const auto& [detail, insides] : lists)
    for (const char* inside : insides) expectRefusal(plist(inside), Kind::malformed, detail);
  const std::pair<std::string, std::vector<const char*>> elements[] = {
      {"integer", {"1.5", "", "--1", "18446744073709551616", "-9223372036854775809"}},
      {"real", {"1,5", "+-1"}},
      {"date", {"2023-02-29T00:00:00Z", "2023-02-28T24:00:00Z", "2023-02-28"}},
      {"data", {"AA*A", "AAA"}}};
  for (const auto& [element, texts] : elements)
    for (const std::string text : texts)
      expectRefusal(plist("<" + element + ">" + text + "</" + element + ">"), Kind::malformed,
                    element == "data" ? "base64" : element);
}

TEST(XMLPropertyList, mendsWhatXMLCannotSay) {
  // Dates lose their fraction and their excess.
  const auto mended = formats::parsePropertyList(
      formats::writeXMLPropertyList(Array{"\x01 \xFF \uFFFE", Date{-0.5}, Date{HUGE_VAL}, Date{NAN}}));
  ASSERT_TRUE(mended.ok()) << mended.error().detail;
  EXPECT_TRUE(mended.value() ==
              Value(Array{"\uFFFD \uFFFD \uFFFD", Date{-1}, Date{253402300799}, Date{-62167219200}}));
}

}  // namespace
}  // namespace veltrad
