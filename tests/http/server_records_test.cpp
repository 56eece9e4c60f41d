// SPDX-License-Identifier: Apache-2.0
// The record of servers at its bound.
#include "http/server_records.h"

#include <gtest/gtest.h>

namespace veltrad {
namespace {

using http::ServerRecords;

TEST(ServerRecords, ForgetThoseThatWereNotUsedForTheLongestTime) {
  ServerRecords records;
  const auto host = [](std::size_t number) { return std::to_string(1000 + number) + ".example:443"; };
  records.ended(std::string(70'000, 'x'), false, 1);  // no such name can be resolved
  EXPECT_LT(records.all().at(0).address.size(), 500u);
  for (std::size_t i = 0; i < ServerRecords::kMost; ++i) records.ended(host(i), i == 0, 5);
  records.ended(host(0), false, 6);
  EXPECT_EQ(records.all().size(), ServerRecords::kMost);
  records.ended(host(ServerRecords::kMost), true, 7);
  const auto all = records.all();
  ASSERT_EQ(all.size(), ServerRecords::kMost);
  EXPECT_EQ(all[0].address, "https://" + host(0));
  EXPECT_EQ(all[0].lastSuccess, 5);
  EXPECT_EQ(all[0].failures, 1u);
  EXPECT_EQ(all[1].address, "https://" + host(2));  // 1 had to go
}

}  // namespace
}  // namespace veltrad
