// SPDX-License-Identifier: Apache-2.0
// Which messages of the kernel announce a route.
#include "platform/network_watch.h"

#include <gtest/gtest.h>
#include <linux/rtnetlink.h>

#include <cstring>
#include <string>

namespace veltrad {
namespace {

std::string message(std::uint16_t type, std::uint32_t length = sizeof(nlmsghdr) + 3) {
  nlmsghdr header{};
  header.nlmsg_type = type;
  header.nlmsg_len = length;
  std::string bytes(reinterpret_cast<const char*>(&header), sizeof header);
  return bytes + std::string(4, 'x');  // padded
}

TEST(NetworkWatch, KnowsARouteThatComesAndEndsAtBrokenLengths) {
  const std::pair<std::string, bool> rows[] = {
      {"", false},
      {message(RTM_NEWROUTE), true},
      {message(RTM_DELROUTE), false},
      {message(RTM_NEWADDR) + message(RTM_NEWROUTE), true},
      {message(RTM_NEWADDR, 4) + message(RTM_NEWROUTE), false},
      {message(RTM_NEWADDR, 4000) + message(RTM_NEWROUTE), false},
      {message(RTM_NEWROUTE).substr(0, sizeof(nlmsghdr) - 1), false}};
  for (const auto& [bytes, tells] : rows)
    EXPECT_EQ(platform::tellsOfRoute(bytes.data(), bytes.size()), tells) << &bytes - &rows[0].first;
  platform::NetworkWatch watch;
  EXPECT_FALSE(watch.happened());
}

}  // namespace
}  // namespace veltrad
