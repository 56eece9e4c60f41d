// Value's rules for numbers and booleans, and the dictionary's order.
#include "base/value.h"

#include <gtest/gtest.h>

#include <cmath>

namespace veltrad {
namespace {

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

TEST(Value, comparesByContent) {
  EXPECT_TRUE(Value(1) == Value(1u));
  EXPECT_FALSE(Value(-1) == Value(UINT64_MAX));
  EXPECT_FALSE(Value(1) == Value(1.0));
  EXPECT_FALSE(Value(1) == Value(true));
  EXPECT_FALSE(Value(Data{"a"}) == Value("a"));
  EXPECT_TRUE(Value(Array{1, Dictionary{{"a", 2}}}) == Value(Array{1u, Dictionary{{"a", 2u}}}));
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

}  // namespace
}  // namespace veltrad
