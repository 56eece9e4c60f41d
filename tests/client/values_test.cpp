// Values of the C interface: built, read, counted.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <string>

#include "veltra/veltra.h"

namespace {

TEST(Values, ReadAsTheirTypeAndAsNothingElse) {
  struct Case {
    veltra_value* value;
    veltra_type type;
    bool boolean;
    int64_t asSigned;
    uint64_t asUnsigned;
    double real;
    const char* text;
    size_t dataLength;
  };
  constexpr auto kLowest = std::numeric_limits<int64_t>::min();
  constexpr auto kHighest = std::numeric_limits<uint64_t>::max();
  const Case cases[] = {
      {nullptr, VELTRA_TYPE_NONE, false, 0, 0, 0, nullptr, 0},
      {veltra_boolean(true), VELTRA_TYPE_BOOLEAN, true, 0, 0, 0, nullptr, 0},
      {veltra_signed(kLowest), VELTRA_TYPE_SIGNED, false, kLowest, 0, -0x1p63, nullptr, 0},
      {veltra_signed(5), VELTRA_TYPE_SIGNED, false, 5, 5, 5, nullptr, 0},
      {veltra_unsigned(kHighest), VELTRA_TYPE_UNSIGNED, false, 0, kHighest, 0x1p64, nullptr, 0},
      {veltra_unsigned(7), VELTRA_TYPE_UNSIGNED, false, 7, 7, 7, nullptr, 0},
      {veltra_real(-HUGE_VAL), VELTRA_TYPE_REAL, false, 0, 0, -HUGE_VAL, nullptr, 0},
      {veltra_date(1.5), VELTRA_TYPE_DATE, false, 0, 0, 1.5, nullptr, 0},
      {veltra_string("a\xC3(\xE2\x82"), VELTRA_TYPE_STRING, false, 0, 0, 0,
       "a\xEF\xBF\xBD(\xEF\xBF\xBD\xEF\xBF\xBD", 0},
      {veltra_string(nullptr), VELTRA_TYPE_NONE, false, 0, 0, 0, nullptr, 0},
      {veltra_data("\0\1\2", 3), VELTRA_TYPE_DATA, false, 0, 0, 0, nullptr, 3},
      {veltra_array(), VELTRA_TYPE_ARRAY, false, 0, 0, 0, nullptr, 0},
  };
  for (const Case& each : cases) {
    SCOPED_TRACE(&each - cases);
    EXPECT_EQ(veltra_type_of(each.value), each.type);
    EXPECT_EQ(veltra_get_boolean(each.value), each.boolean);
    EXPECT_EQ(veltra_get_signed(each.value), each.asSigned);
    EXPECT_EQ(veltra_get_unsigned(each.value), each.asUnsigned);
    EXPECT_EQ(veltra_get_real(each.value), each.real);
    EXPECT_STREQ(veltra_get_string(each.value, nullptr), each.text);
    size_t length = 99;
    EXPECT_EQ(veltra_get_data(each.value, &length) != nullptr, each.dataLength > 0);
    EXPECT_EQ(length, each.dataLength);
    veltra_release(each.value);
  }
  veltra_value* nan = veltra_real(std::nan(""));
  EXPECT_TRUE(std::isnan(veltra_get_real(nan)));
  veltra_release(nan);
  veltra_value* text = veltra_string_with_length("a\0b", 3);
  size_t length = 0;
  EXPECT_EQ(std::string(veltra_get_string(text, &length), length), std::string("a\0b", 3));
  veltra_release(text);
}

TEST(Values, DictionariesKeepTheOrderOfKeysHoweverLargeAndHoweverBuilt) {
  constexpr unsigned kEntries = 60'000;
  veltra_value* dictionary = veltra_dictionary();
  for (unsigned round = 0; round < 2; ++round) {  // the second replaces every value
    for (unsigned i = 0; i < kEntries; ++i) {
      const unsigned key = 100'000 + i * 7'919u % kEntries;
      ASSERT_EQ(veltra_dictionary_set(dictionary, std::to_string(key).c_str(), veltra_unsigned(key + round)),
                VELTRA_OK);
    }
  }
  ASSERT_EQ(veltra_count(dictionary), kEntries);
  for (unsigned i = 0; i < kEntries; ++i) {
    const char* key = nullptr;
    const veltra_value* value = veltra_dictionary_entry(dictionary, i, &key);
    ASSERT_STREQ(key, std::to_string(100'000 + i).c_str());
    ASSERT_EQ(veltra_get_unsigned(value), 100'001 + i);
  }
  const char* key = "left over";
  EXPECT_EQ(veltra_dictionary_entry(dictionary, kEntries, &key), nullptr);
  EXPECT_EQ(key, nullptr);
  EXPECT_EQ(veltra_dictionary_item(dictionary, "none"), nullptr);
  veltra_dictionary_set(dictionary, "0", veltra_boolean(true));
  veltra_dictionary_entry(dictionary, 0, &key);
  EXPECT_STREQ(key, "0");
  veltra_release(dictionary);
}

// Under AddressSanitizer this also shows that every reference is let go, taken over or not.
TEST(Values, PartsAreFrozenAndRefusedOnesAreReleased) {
  veltra_value* array = veltra_array();
  veltra_value* inner = veltra_dictionary();
  EXPECT_EQ(veltra_array_append(array, veltra_retain(inner)), VELTRA_OK);
  EXPECT_EQ(veltra_dictionary_set(inner, "late", veltra_signed(1)), VELTRA_INVALID);
  EXPECT_EQ(veltra_dictionary_set(inner, "loop", veltra_retain(array)), VELTRA_INVALID);
  EXPECT_EQ(veltra_array_append(array, veltra_retain(array)), VELTRA_INVALID);
  EXPECT_EQ(veltra_array_append(array, veltra_retain(inner)), VELTRA_OK);
  EXPECT_EQ(veltra_dictionary_set(array, "k", veltra_signed(1)), VELTRA_INVALID);
  EXPECT_EQ(veltra_array_append(nullptr, veltra_signed(1)), VELTRA_INVALID);
  EXPECT_EQ(veltra_array_append(array, nullptr), VELTRA_INVALID);
  veltra_value* dictionary = veltra_dictionary();
  EXPECT_EQ(veltra_dictionary_set(dictionary, nullptr, veltra_signed(1)), VELTRA_INVALID);
  EXPECT_EQ(veltra_count(dictionary), 0u);
  veltra_release(dictionary);
  EXPECT_EQ(veltra_count(array), 2u);
  EXPECT_EQ(veltra_array_item(array, 1), inner);
  EXPECT_EQ(veltra_array_item(array, 2), nullptr);
  veltra_release(array);
  EXPECT_EQ(veltra_count(inner), 0u);
  veltra_release(inner);

  veltra_value* deep = veltra_array();
  for (int depth = 1; depth < 64; ++depth) {
    veltra_value* outer = veltra_array();
    ASSERT_EQ(veltra_array_append(outer, deep), VELTRA_OK) << depth;
    deep = outer;
  }
  veltra_value* tooDeep = veltra_array();
  EXPECT_EQ(veltra_array_append(tooDeep, deep), VELTRA_INVALID);
  veltra_release(tooDeep);
}

}  // namespace
