// SPDX-License-Identifier: Apache-2.0
// Formatted texts with numbers, compared with the fmt library.
#include "base/filled_text.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <bit>
#include <limits>
#include <random>

namespace {

using veltrad::filled;
using veltrad::textOf;

TEST(FilledText, WritesNumbersLikeFmtAndFillsInParts) {
  std::mt19937_64 random(7);
  std::vector<double> numbers{0,
                              -0.0,
                              1,
                              0.1,
                              1e15,
                              1e16,
                              9999999999999998,
                              1e-4,
                              1e-5,
                              123456.789,
                              5e-324,
                              std::numeric_limits<double>::max(),
                              std::numeric_limits<double>::infinity(),
                              -std::numeric_limits<double>::quiet_NaN()};
  for (int i = 0; i < 20'000; ++i) {
    numbers.push_back(std::bit_cast<double>(random()));
    numbers.push_back(static_cast<double>(random() >> (i % 64)) / 1024);
  }
  for (const double number : numbers) ASSERT_EQ(textOf(number), fmt::format("{}", number));
  EXPECT_EQ(filled("{} of {}: {}{}", 3u, -4L, "{}", std::string("x")), "3 of -4: {}x");
  EXPECT_EQ(filled("100 %"), "100 %");
}

}  // namespace
