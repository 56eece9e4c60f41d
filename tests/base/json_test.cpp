// JSON both ways, and where errors are said to be.
#include "base/json.h"

#include <gtest/gtest.h>

#include <cmath>

namespace veltrad {
namespace {

using namespace std::literals;

TEST(JSON, readsValues) {
  const std::pair<std::string, Value> kCases[] = {
      {" true ", true},
      {"-7", -7},
      {"18446744073709551615", UINT64_MAX},
      {"18446744073709551616", 18446744073709551616.0},
      {"1.0", 1.0},
      {"1e2", 100.0},
      {"[0e300, -0.0, -1.5E-3]", Array{0.0, -0.0, -0.0015}},
      {R"("\u00e9\ud83d\ude00\u0000")", "\u00e9\U0001F600\0"s},
      {R"([{}, [], {"a": 1, "n": null, "a": 2}])", Array{Dictionary{}, Array{}, Dictionary{{"a", 2}}}},
      {R"({"$date": 1.5})", Date{1.5}},
      {R"({"$date": 1, "$date": 2})", Date{2}},
      {R"({"$data": "AAE="})", Data{"\0\1"s}},
      {R"({"$date": 1, "b": 2})", Dictionary{{"$date", 1}, {"b", 2}}},
      {std::string(64, '[') + std::string(64, ']'),
       [] {
         Value value = Array{};
         for (int i = 1; i < 64; ++i) value = Array{value};
         return value;
       }()},
  };
  for (const auto& [text, value] : kCases) {
    const auto read = parseJSON(text);
    ASSERT_TRUE(read.ok()) << text << ": " << read.error().detail;
    EXPECT_TRUE(read.value() == value) << text;
    EXPECT_EQ(read.value().type(), value.type()) << text;
  }
}

TEST(JSON, saysWhatIsWrongAndWhere) {
  struct Case {
    std::string text;
    std::size_t offset;
  } const kCases[] = {{"", 0},
                      {"[1, 2", 5},
                      {"{\"a\" 1}", 5},
                      {"[1] x", 4},
                      {"1\0 2"s, 1},
                      {"[null]", 5},
                      {"null", 4},
                      {"\"\xED\xA0\x80\"", 1},
                      {"\"\xFF\"", 1},
                      {"'a'", 0},
                      {"[NaN]", 1},
                      {"1e999", 0},
                      {"\"\\ud800\"", 1},
                      {"[1,]", 3},
                      {std::string(100'000, '['), 65},
                      {"\"\\ude00\"", 8},
                      {R"({"$date": "x"})", 14},
                      {R"({"$data": "*A"})", 15}};
  for (const Case& c : kCases) {
    const auto read = parseJSON(c.text);
    ASSERT_FALSE(read.ok()) << c.text;
    EXPECT_NEAR(static_cast<double>(read.error().offset), static_cast<double>(c.offset), 1) << c.text;
    EXPECT_FALSE(read.error().detail.empty()) << c.text;
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
