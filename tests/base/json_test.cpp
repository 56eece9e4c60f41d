// JSON both ways, and where errors are said to be.
#include "base/json.h"

#include <gtest/gtest.h>

#include <cmath>

namespace veltrad {
namespace {

using namespace std::literals;

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
    const auto read = parseJSON(text);
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
    const auto read = parseJSON(std::string_view(row).substr(row.find(' ') + 1));
    ASSERT_FALSE(read.ok()) << row;
    EXPECT_NEAR(static_cast<double>(read.error().offset), std::stod(row), 1) << row;
    EXPECT_FALSE(read.error().detail.empty()) << row;
  }
}

TEST(JSON, writesWhatItReads) {
  const Value value = Dictionary{{"a\"\n", Array{1, -1, UINT64_MAX, 0.1, 2.0, true, "\u00e9"}},
                                 {"d", Array{Date{1.25}, Data{"\xFF"}, Dictionary{}, Array{}}}};
  for (const JSONStyle style : {JSONStyle::compact, JSONStyle::pretty}) {
    const auto read = parseJSON(writeJSON(value, style));
    ASSERT_TRUE(read.ok()) << read.error().detail;
    EXPECT_TRUE(read.value() == value);
  }
  EXPECT_EQ(writeJSON(Dictionary{{"b", Array{1, 2.0}}, {"a", "x"}}), R"({"a":"x","b":[1,2.0]})");
  EXPECT_EQ(writeJSON(Dictionary{{"a", 1}}, JSONStyle::pretty), "{\n  \"a\": 1\n}");
  EXPECT_EQ(writeJSON(Array{NAN, HUGE_VAL, "a\xFF"}), "[null,null,\"a\uFFFD\"]");
}

}  // namespace
}  // namespace veltrad
