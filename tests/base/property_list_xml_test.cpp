// XML property lists: every element, what is written, what is refused and where.
#include <gtest/gtest.h>

#include <clocale>
#include <cmath>

#include "base/property_list.h"

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
  struct Case {
    std::string inside;
    Value value;
  } const kCases[] = {
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
       Dictionary{{"a", "x"}, {"b", true}}},
  };
  for (const auto& [inside, value] : kCases) {
    for (const std::string& list :
         {plist(inside), utf16(plist(inside)),
          "\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC \"-//X//DTD//EN\" "
          "\"https://host.invalid/x.dtd\">\n<?what ever?>" +
              plist(inside) + "\n"}) {
      const auto read = parsePropertyList(list);
      ASSERT_TRUE(read.ok()) << inside << ": " << read.error().detail;
      EXPECT_TRUE(read.value() == value) << inside;
    }
  }
  const auto nan = parsePropertyList(plist("<real>nan</real>"));
  ASSERT_TRUE(nan.ok());
  EXPECT_TRUE(std::isnan(*nan.value().asReal()));
}

TEST(XMLPropertyList, refusesWhatIsNone) {
  struct Case {
    std::string list;
    Kind kind;
    const char* detail;  // a part of it
  } const kCases[] = {
      {"", Kind::notAPropertyList, "XML"},
      {"{\"a\": 1}", Kind::notAPropertyList, "XML"},
      {"{ a = 1; }", Kind::notAPropertyList, "XML"},
      {"<html><body/></html>", Kind::notAPropertyList, "<html> where <plist>"},
      {"<plist version=\"2.0\"><true/></plist>", Kind::malformed, "version \"2.0\""},
      {plist(""), Kind::malformed, "no value"},
      {plist("<true/><true/>"), Kind::malformed, "second value"},
      {plist("\n<array>\n<true/>"), Kind::malformed, "line 3"},
      {plist("text<true/>"), Kind::malformed, "text between"},
      {plist("<null/>"), Kind::malformed, "unknown element <null>"},
      {plist("<plist/>"), Kind::malformed, "unknown element <plist>"},
      {plist("<key>a</key>"), Kind::malformed, "key where a value"},
      {plist("<string><true/></string>"), Kind::malformed, "inside a text"},
      {plist("<dict><true/></dict>"), Kind::malformed, "value without a key"},
      {plist("<dict><key>a</key></dict>"), Kind::malformed, "no value for the key \"a\""},
      {plist("<dict><key>a</key><key>b</key></dict>"), Kind::malformed, "key where a value"},
      {plist("<true>no</true>"), Kind::malformed, "empty element"},
      {plist("<integer>1.5</integer>"), Kind::malformed, "integer"},
      {plist("<integer></integer>"), Kind::malformed, "integer"},
      {plist("<integer>--1</integer>"), Kind::malformed, "integer"},
      {plist("<integer>18446744073709551616</integer>"), Kind::malformed, "integer"},
      {plist("<integer>-9223372036854775809</integer>"), Kind::malformed, "integer"},
      {plist("<real>1,5</real>"), Kind::malformed, "real"},
      {plist("<real>+-1</real>"), Kind::malformed, "real"},
      {plist("<date>2023-02-29T00:00:00Z</date>"), Kind::malformed, "date"},
      {plist("<date>2023-02-28T24:00:00Z</date>"), Kind::malformed, "date"},
      {plist("<date>2023-02-28</date>"), Kind::malformed, "date"},
      {plist("<data>AA*A</data>"), Kind::malformed, "base64"},
      {plist("<data>AAA</data>"), Kind::malformed, "base64"},
      {plist("<string>\xC0\xAF</string>"), Kind::malformed, "line 1"},
      {plist("<string>&none;</string>"), Kind::malformed, "line 1"},
      {"<!DOCTYPE plist [<!ENTITY a \"b\">]>" + plist("<string>&a;</string>"), Kind::forbidden,
       "internal subset"},
      {"<!DOCTYPE plist SYSTEM \"file:///etc/passwd\" []>" + plist("<true/>"), Kind::forbidden,
       "internal subset"},
      {"<!DOCTYPE plist SYSTEM \"x.dtd\">" + plist("<string>&a;</string>"), Kind::forbidden, "entity \"a\""},
  };
  for (const Case& c : kCases) {
    const auto read = parsePropertyList(c.list);
    ASSERT_FALSE(read.ok()) << c.list;
    EXPECT_EQ(read.error().kind, c.kind) << c.list << ": " << read.error().detail;
    EXPECT_NE(read.error().detail.find(c.detail), std::string::npos) << c.list << ": " << read.error().detail;
  }
}

TEST(XMLPropertyList, writesWhatItReads) {
  const Value value =
      Dictionary{{"a<b>&\"\r\n", Array{"x\ty", "\u00e9\U0001F600", "", " "}},
                 {"n", Array{-1, INT64_MIN, UINT64_MAX, 0.1, -1e300, HUGE_VAL, true, false}},
                 {"d", Array{Date{0}, Date{-62167219200}, Date{253402300799}, Data{"\0\xFF"s}}},
                 {"e", Dictionary{{"none", Array{}}, {"", Dictionary{}}}}};
  const std::string text = writeXMLPropertyList(value);
  const auto read = parsePropertyList(text);
  ASSERT_TRUE(read.ok()) << read.error().detail << "\n" << text;
  EXPECT_TRUE(read.value() == value) << text;

  // What XML cannot say is mended; dates lose their fraction and their excess.
  const auto mended = parsePropertyList(
      writeXMLPropertyList(Array{"\x01 \xFF \uFFFE", Date{-0.5}, Date{HUGE_VAL}, Date{NAN}}));
  ASSERT_TRUE(mended.ok()) << mended.error().detail;
  EXPECT_TRUE(mended.value() ==
              Value(Array{"\uFFFD \uFFFD \uFFFD", Date{-1}, Date{253402300799}, Date{-62167219200}}));
}

TEST(XMLPropertyList, holdsItsLimitsExactly) {
  const std::string list =
      plist("<dict><key>abc</key><array><data>AAAA</data><string>xy</string></array></dict>");
  const PropertyListLimits fits{.bytes = list.size(), .depth = 2, .objects = 5, .textBytes = 8};
  EXPECT_TRUE(parsePropertyList(list, fits).ok());
  const auto errorWith = [&](auto change) {
    PropertyListLimits limits = fits;
    change(limits);
    return parsePropertyList(list, limits).error().kind;
  };
  EXPECT_EQ(errorWith([](auto& l) { --l.bytes; }), Kind::tooLarge);
  EXPECT_EQ(errorWith([](auto& l) { --l.objects; }), Kind::tooLarge);
  EXPECT_EQ(errorWith([](auto& l) { --l.textBytes; }), Kind::tooLarge);
  EXPECT_EQ(errorWith([](auto& l) { --l.depth; }), Kind::tooDeep);
}

}  // namespace
}  // namespace veltrad
