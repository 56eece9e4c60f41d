// SPDX-License-Identifier: Apache-2.0
// Values of the C interface: nesting rules and ownership.
#include <gtest/gtest.h>

#include "veltra/veltra.hpp"

namespace {

using veltra::Value;

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
