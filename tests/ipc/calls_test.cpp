// What becomes of the reply to a call.
#include "harness.h"

namespace veltrad::ipc_test {
namespace {

TEST(Replies, CountOnceComeInAnyOrderAndAreNeverOwedForGood) {
  Door door;
  std::vector<StringReply> held;  // the connection's thread's until the journal says so
  door.onMessage = [&](std::uint16_t category, StringReply reply) {
    if (category == 1) return;  // dropped
    if (category == 2) {
      const StringReply copy = reply;
      reply("first");
      return copy("second");
    }
    if (category == 3) return reply(std::string(1'200'000, 'x'));
    held.push_back(std::move(reply));
    if (held.size() == 3) door.journal.add("held");
  };
  WireEnd client = door.client();
  client.send(messageFrame(1, 1) + messageFrame(2, 2) + messageFrame(3, 3) + messageFrame(4, 4) +
              messageFrame(5, 4) + messageFrame(0, 4));
  EXPECT_EQ(client.next().results(), "The daemon gave no reply.");
  EXPECT_EQ(client.next().results(), R"({"reply":"first"})");
  const std::string tooLarge = client.next().description();
  EXPECT_THAT(tooLarge, HasSubstr("The reply of 12000"));
  EXPECT_THAT(tooLarge, HasSubstr("(1048576 bytes)"));
  ASSERT_TRUE(door.journal.waitFor("held"));
  held[1](std::nullopt);
  held[0]("late");
  EXPECT_FALSE(held[2]);  // no reply was wanted: nothing to call
  EXPECT_EQ(client.next().results(), "{}");
  const Received last = client.next();
  EXPECT_EQ(last.callID, 4u);
  EXPECT_EQ(last.results(), R"({"reply":"late"})");
}

TEST(Replies, MayOutliveTheConnection) {
  StringReply late;
  Door door;
  door.onMessage = [&](std::uint16_t, StringReply reply) { late = std::move(reply); };
  WireEnd client = door.client();
  client.send(messageFrame(1));
  client.hangUp(SHUT_WR);
  EXPECT_TRUE(door.journal.waitFor("end"));
  EXPECT_TRUE(client.atEnd());
  EXPECT_EQ(door.stop(), 0u);
  late("nobody is there");
  EXPECT_EQ(door.counters.value("reply dropped: the client has gone"), 1u);
  late = nullptr;  // before the counters go
}

}  // namespace
}  // namespace veltrad::ipc_test
