// Values of the C interface: built, read, counted.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "veltra/veltra.hpp"

namespace {

using veltra::Value;

TEST(Values, ReadAsTheirTypeAndAsNothingElse) {
  constexpr auto kLowest = std::numeric_limits<std::int64_t>::min();
  constexpr auto kHighest = std::numeric_limits<std::uint64_t>::max();
  using Text = std::optional<std::string_view>;
  const std::string_view nul("a\0b", 3);
  const std::tuple<Value, veltra_type, std::int64_t, std::uint64_t, double, Text, Text> cases[] = {
      {true, VELTRA_TYPE_BOOLEAN, 0, 0, 0, {}, {}},
      {kLowest, VELTRA_TYPE_SIGNED, kLowest, 0, -0x1p63, {}, {}},
      {5, VELTRA_TYPE_SIGNED, 5, 5, 5, {}, {}},
      {kHighest, VELTRA_TYPE_UNSIGNED, 0, kHighest, 0x1p64, {}, {}},
      {-HUGE_VAL, VELTRA_TYPE_REAL, 0, 0, -HUGE_VAL, {}, {}},
      {veltra::Date{1.5}, VELTRA_TYPE_DATE, 0, 0, 1.5, {}, {}},
      {"a\xC3(\xE2\x82", VELTRA_TYPE_STRING, 0, 0, 0, "a\xEF\xBF\xBD(\xEF\xBF\xBD\xEF\xBF\xBD", {}},
      {std::string(nul), VELTRA_TYPE_STRING, 0, 0, 0, nul, {}},
      {static_cast<const char*>(nullptr), VELTRA_TYPE_NONE, 0, 0, 0, {}, {}},
      {veltra::Data{std::string(nul)}, VELTRA_TYPE_DATA, 0, 0, 0, {}, nul},
      {veltra::Array{}, VELTRA_TYPE_ARRAY, 0, 0, 0, {}, {}}};
  for (const auto& [value, type, asSigned, asUnsigned, real, string, data] : cases) {
    SCOPED_TRACE(type);
    EXPECT_EQ(value.type(), type);
    EXPECT_EQ(value.boolean(), type == VELTRA_TYPE_BOOLEAN);
    EXPECT_EQ(value.asSigned(), asSigned);
    EXPECT_EQ(value.asUnsigned(), asUnsigned);
    EXPECT_EQ(value.real(), real);
    EXPECT_EQ(value.string(), string);
    EXPECT_EQ(value.data(), data);
  }
}

TEST(Values, DictionariesKeepTheOrderOfKeysHoweverLargeAndHoweverBuilt) {
  constexpr unsigned kEntries = 60'000;
  veltra::Dictionary dictionary;
  for (unsigned round = 0; round < 2; ++round) {  // the second replaces every value
    for (unsigned i = 0; i < kEntries; ++i) {
      const unsigned key = 100'000 + i * 7'919u % kEntries;
      ASSERT_TRUE(dictionary.set(std::to_string(key).c_str(), key + round));
    }
  }
  ASSERT_EQ(dictionary.count(), kEntries);
  for (unsigned i = 0; i < kEntries; ++i) {
    const auto [key, value] = dictionary.entry(i);
    ASSERT_EQ(key, std::to_string(100'000 + i));
    ASSERT_EQ(value.asUnsigned(), 100'001 + i);
  }
  EXPECT_FALSE(dictionary.entry(kEntries).second);
  EXPECT_FALSE(dictionary.item("none"));
}

// Under AddressSanitizer this also shows that every reference is let go, taken over or not.
TEST(Values, PartsAreFrozenAndRefusedOnesAreReleased) {
  veltra::Array array;
  veltra::Dictionary inner;
  EXPECT_TRUE(array.append(inner));
  EXPECT_FALSE(inner.set("late", 1));
  EXPECT_FALSE(inner.set("loop", array));
  EXPECT_FALSE(array.append(array));
  EXPECT_TRUE(array.append(inner));
  EXPECT_FALSE(array.append({}));
  EXPECT_FALSE(veltra::Dictionary{}.set(nullptr, 1));
  EXPECT_EQ(veltra_dictionary_set(const_cast<veltra_value*>(array.get()), "k", veltra_signed(1)),
            VELTRA_INVALID);
  EXPECT_EQ(veltra_array_append(nullptr, veltra_signed(1)), VELTRA_INVALID);
  EXPECT_EQ(array.count(), 2u);
  EXPECT_EQ(array.item(1).get(), inner.get());
  EXPECT_FALSE(array.item(2));
  EXPECT_EQ(inner.count(), 0u);

  Value deep = veltra::Array{};
  for (int depth = 1; depth < 64; ++depth) {
    veltra::Array outer;
    ASSERT_TRUE(outer.append(deep)) << depth;
    deep = outer;
  }
  EXPECT_FALSE(veltra::Array{}.append(deep));
}

}  // namespace
