// SPDX-License-Identifier: Apache-2.0
// The daemon for tests, through its installed headers alone.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <veltra/testing.hpp>

namespace {

using namespace std::chrono_literals;
using veltra::Dictionary;

TEST(TestingDaemon, KeepsEveryMessageOverRestarts) {
  std::string root;
  {
    veltra::testing::Daemon daemon;
    ASSERT_TRUE(daemon) << daemon.error();
    root = daemon.root();
    veltra::Session session{
        {.clientType = 7, .clientName = "phone", .root = root, .frameworksToCheck = veltra::Array{"A"}}};
    EXPECT_EQ((*session.start())->at(0), "testing");
    const Dictionary payload{{"text", "ü"},
                             {"more", ~0ull},
                             {"day", veltra::Date{86400}},
                             {"data", veltra::Data{"\x01"}},
                             {"list", veltra::Array{1, true, -0.5, Dictionary{}}}};
    const veltra::Reply reply = session.sendAndWait(5, 1, payload, 3);
    EXPECT_EQ(reply.outcomes->at(0).outcome, "delivered");
    session.send({{"category", 6}, {"type", 70'000}}).get();
    session.sendOneShot({.clientType = 2, .sessionID = 9}, 7, 1).get();
    for (int number = 0; number < 500; ++number) {
      session.post(8, static_cast<std::uint16_t>(number));
      if (number == 250) ASSERT_TRUE(daemon.restart());
    }
    ASSERT_TRUE(daemon.wait(503));
    EXPECT_FALSE(daemon.wait(504, 1ms));
    const veltra::testing::Message first = daemon.message(0);
    EXPECT_EQ(first.flag, 3u);
    EXPECT_EQ(first.sessionInfo.item("clientType").asSigned(), 7);
    EXPECT_EQ(first.userInfo.item("clientName").string(), "phone");
    EXPECT_EQ(first.payload.count(), payload.count());
    EXPECT_EQ(first.payload.item("more").asUnsigned(), ~0ull);
    EXPECT_EQ(first.payload.item("day").type(), VELTRA_TYPE_DATE);
    EXPECT_EQ(first.payload.item("data").data(), "\x01");
    EXPECT_EQ(first.payload.item("list").item(2).real(), -0.5);
    EXPECT_EQ(daemon.message(1).type, 70'000 % 65'536);
    EXPECT_EQ(daemon.message(2).sessionInfo.item("sessionID").asUnsigned(), 9u);
    for (std::size_t index = 3; index < daemon.count(); ++index) {
      EXPECT_EQ(daemon.message(index).type, index - 3);
      EXPECT_EQ(daemon.message(index).sessionInfo.item("clientType").asSigned(), 2);
    }
    EXPECT_FALSE(daemon.message(503).sessionInfo);
    EXPECT_EQ(session.counter(VELTRA_COUNTER_LOST) + session.close(), 0u);
  }
  EXPECT_FALSE(std::filesystem::exists(root));
}

TEST(TestingDaemon, RefusesAndDelaysAsOrdered) {
  veltra::testing::Daemon daemon;
  veltra::Session session{{.clientType = 7, .root = daemon.root()}};
  daemon.refuse("no room");
  const veltra::Reply refused = session.sendAndWait(5, 1, {});
  EXPECT_EQ(refused.status, VELTRA_REFUSED);
  EXPECT_EQ(refused.error->description, "no room");
  const veltra::Session other{{.root = daemon.root()}};
  EXPECT_EQ(other.error().status, VELTRA_REFUSED);
  EXPECT_NE(other.error().description.find("no room"), std::string::npos);
  daemon.acceptAgain();
  daemon.delay(300ms);
  const auto begin = std::chrono::steady_clock::now();
  auto slow = session.send(5, 2);
  EXPECT_TRUE(daemon.wait(1));
  EXPECT_EQ(slow.get().status, VELTRA_OK);
  EXPECT_GE(std::chrono::steady_clock::now() - begin, 300ms);
  EXPECT_EQ(daemon.message(0).type, 2);
  daemon.delay(1h);
  auto never = session.send(5, 3);
  ASSERT_TRUE(daemon.wait(2));
  ASSERT_TRUE(daemon.restart());
  EXPECT_EQ(never.get().status, VELTRA_NO_REPLY);
}

TEST(TestingDaemon, SaysWhyItCannotStart) {
  ::setenv("TMPDIR", "/nowhere", 1);
  const veltra::testing::Daemon daemon;
  ::unsetenv("TMPDIR");
  EXPECT_FALSE(daemon);
  EXPECT_NE(daemon.error().find("/nowhere"), std::string::npos) << daemon.error();
}

}  // namespace
