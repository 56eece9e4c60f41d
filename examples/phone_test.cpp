// SPDX-License-Identifier: Apache-2.0
// How a program tests its own reporting, with GoogleTest: c++ -std=c++20 phone_test.cpp
//   $(pkg-config --cflags --libs veltra-testing gtest_main)
#include <gtest/gtest.h>

#include <veltra/testing.hpp>

// The code under test.
void reportCall(veltra::Session& session, const char* codec, double seconds) {
  session.start();
  session.send(5, 1, {{"codec", codec}, {"seconds", seconds}});
}

TEST(Phone, ReportsACall) {
  veltra::testing::Daemon daemon;
  veltra::Session session{{.clientType = 7, .clientName = "phone", .root = daemon.root()}};
  reportCall(session, "opus", 12.5);
  ASSERT_TRUE(daemon.wait(1));
  const veltra::testing::Message message = daemon.message(0);
  EXPECT_EQ(message.category, 5);
  EXPECT_EQ(message.type, 1);
  EXPECT_EQ(message.payload.item("codec").string(), "opus");
}
