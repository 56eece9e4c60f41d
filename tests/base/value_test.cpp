// SPDX-License-Identifier: Apache-2.0
// Value's rules for numbers and booleans, the dictionary's order, and JSON both ways.
#include "base/value.h"

#include <gtest/gtest.h>

#include <cmath>

#include "formats/json.h"

namespace veltrad {
namespace {

using namespace std::literals;

TEST(Value, readsNumbersByOneRule) {
  const struct {
    Value value;
    std::optional<bool> boolean;
    std::optional<std::int32_t> int32;
    std::optional<std::uint16_t> uint16;
    std::optional<double> real;
    std::optional<std::string> text;
  } kCases[] = {{true, true, 1, 1, 1.0, "1"},
                {0, false, 0, 0, 0.0, "0"},
                {-1, true, -1, 65535, -1.0, "-1"},
                {4294967297, true, 1, 1, 4294967297.0, "4294967297"},
                {UINT64_MAX, true, -1, 65535, 18446744073709551616.0, "18446744073709551615"},
                {-1.9, true, -1, 65535, -1.9, "-1.9"},
                {65537.5, true, 65537, 1, 65537.5, "65537.5"},
                {2.0, true, 2, 2, 2.0, "2"},
                {0x1p64, true, {}, {}, 0x1p64, "1.8446744073709552e+19"},
                {NAN, {}, {}, {}, {}, "nan"},
                {HUGE_VAL, {}, {}, {}, {}, "inf"},
                {"1", {}, {}, {}, {}, "1"},
                {Array{}, {}, {}, {}, {}, {}}};
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.text.value_or("none"));
    EXPECT_EQ(c.value.toBoolean(), c.boolean);
    EXPECT_EQ(c.value.toInt32(), c.int32);
    EXPECT_EQ(c.value.toUInt16(), c.uint16);
    EXPECT_EQ(c.value.toDouble(), c.real);
    EXPECT_EQ(c.value.toText(), c.text);
  }
}

TEST(Dictionary, keepsKeysInOrder) {
  Dictionary dictionary{{"b", 1}, {"a", 2}, {"b", 3}};
  dictionary.set("aa", 4);
  dictionary.set("a", 5);
  dictionary.merge({{"0", 6}, {"aa", 7}, {"\xFF", 8}});
  EXPECT_TRUE(dictionary.erase("b"));
  EXPECT_FALSE(dictionary.erase("b"));
  std::string seen;
  for (const auto& [key, value] : dictionary) seen += key + "=" + *value.toText() + " ";
  EXPECT_EQ(seen, "0=6 a=5 aa=7 \xFF=8 ");
  EXPECT_EQ(dictionary.int32("aa"), 7);
  EXPECT_EQ(dictionary.find("b"), nullptr);
}

TEST(Dictionary, sharesEntriesUntilOneOfItsCopiesChanges) {
  const Dictionary first{{"a", Dictionary{{"x", 1}}}, {"b", "a text that is too long for a string itself"}};
  Dictionary set = first, erased = first, merged = first, taken = first;
  EXPECT_EQ(set.find("b"), first.find("b"));
  set.set("b", 2);
  erased.erase("a");
  merged.merge({{"a", 3}, {"c", 4}});
  EXPECT_EQ(taken.takeDictionary("a")->int32("x"), 1);
  EXPECT_EQ(formats::writeJSON(first), R"({"a":{"x":1},"b":"a text that is too long for a string itself"})");
  EXPECT_EQ(set.int32("b"), 2);
  EXPECT_EQ(erased.size(), 1u);
  EXPECT_EQ(merged.int32("a"), 3);
  EXPECT_EQ(merged.size(), 3u);
  EXPECT_TRUE(taken.dictionary("a")->empty());
}

TEST(JSON, readsValues) {
  Value nested = Array{};
  for (int i = 1; i < 64; ++i) nested = Array{nested};
  const std::pair<std::string, Value> kCases[] = {
      {" true ", true},
      {"-7", -7},
      {"18446744073709551615", UINT64_MAX},
      {"18446744073709551616", 0x1p64},
      {"1.0", 1.0},
      {"1e2", 100.0},
      {"[0e300, -0.0, -1.5E-3]", Array{0.0, -0.0, -0.0015}},
      {R"("\u00e9\ud83d\ude00\u0000")", "\u00e9\U0001F600\0"s},
      {R"([{}, [], {"a": 1, "n": null, "a": 2}])", Array{Dictionary{}, Array{}, Dictionary{{"a", 2}}}},
      {R"({"$date": 1.5})", Date{1.5}},
      {R"({"$date": 1, "$date": 2})", Date{2}},
      {R"({"$data": "AAE="})", Data{"\0\1"s}},
      {R"({"$date": 1, "b": 2})", Dictionary{{"$date", 1}, {"b", 2}}},
      {std::string(64, '[') + std::string(64, ']'), nested}};
  for (const auto& [text, value] : kCases) {
    const auto read = formats::parseJSON(text);
    ASSERT_TRUE(read.ok()) << text << ": " << read.error().detail;
    EXPECT_TRUE(read.value() == value) << text;
    EXPECT_EQ(read.value().type(), value.type()) << text;
  }
}

TEST(JSON, saysWhatIsWrongAndWhere) {
  // The offset, a space, the text.
  for (const std::string& row :
       {"0 "s, "5 [1, 2"s, "5 {\"a\" 1}"s, "4 [1] x"s, "1 1\0 2"s, "5 [null]"s, "4 null"s,
        "1 \"\xED\xA0\x80\""s, "1 \"\xFF\""s, "0 'a'"s, "1 [NaN]"s, "0 1e999"s, "1 \"\\ud800\""s,
        "8 \"\\ude00\""s, "3 [1,]"s, "65 " + std::string(100'000, '['), R"(14 {"$date": "x"})"s,
        R"(15 {"$data": "*A"})"s}) {
    const auto read = formats::parseJSON(std::string_view(row).substr(row.find(' ') + 1));
    ASSERT_FALSE(read.ok()) << row;
    EXPECT_NEAR(static_cast<double>(read.error().offset), std::stod(row), 1) << row;
    EXPECT_FALSE(read.error().detail.empty()) << row;
  }
}

TEST(JSON, isWrittenInOrderAndMended) {
  EXPECT_EQ(formats::writeJSON(Dictionary{{"b", Array{1, 2.0}}, {"a", "x"}}), R"({"a":"x","b":[1,2.0]})");
  EXPECT_EQ(formats::writeJSON(Dictionary{{"a", 1}}, formats::JSONStyle::pretty), "{\n  \"a\": 1\n}");
  EXPECT_EQ(formats::writeJSON(Array{NAN, HUGE_VAL, "a\xFF"}), "[null,null,\"a\uFFFD\"]");
  const Value nested = Array{Dictionary{}, Array{}, Dictionary{{"a", Array{true, Date{1.5}}}}};
  EXPECT_EQ(formats::writeJSON(nested, formats::JSONStyle::pretty),
            "[\n  {},\n  [],\n  {\n    \"a\": [\n      true,\n      {\n        \"$date\": 1.5\n      }\n    "
            "]\n  }\n]");
  // Each character that needs care at each place in a word of eight.
  const std::pair<std::string, std::string> kEscapes[] = {
      {"\"", "\\\""}, {"\\", "\\\\"},   {"\n", "\\n"},       {"\x1F", "\\u001F"},
      {" ", " "},     {"\x7F", "\x7F"}, {"\u00e9", "\u00e9"}};
  for (const auto& [character, escaped] : kEscapes) {
    for (std::size_t before = 0; before < 17; ++before) {
      for (const std::size_t after : {0u, 1u, 5u, 9u, 700u}) {
        const std::string start(before, 'a'), end(after, '~');
        EXPECT_EQ(formats::writeJSON(start + character + end), "\"" + start + escaped + end + "\"");
      }
    }
  }
}

}  // namespace
}  // namespace veltrad
