// SPDX-License-Identifier: Apache-2.0
// The arguments that a call needs, and its reply.
#include "harness.h"

namespace veltrad::ipc_test {
namespace {

TEST(Calls, ThatCannotBeReadSayWhyAndInterruptNothingElse) {
  const auto call = [](const char* op, Dictionary arguments) {
    return callFrame(9, op, std::move(arguments));
  };
  const std::vector<std::pair<std::string, const char*>> cases{
      {rawFrame(wire::FrameKind::call, ""), "the body is no readable property list"},
      {rawFrame(wire::FrameKind::call, "bplist00 and then rubbish"), "the body is no readable property list"},
      {rawFrame(wire::FrameKind::call, writeBinaryPropertyList(Array{1})), "the body must be a dictionary"},
      {wire::makeFrame(wire::FrameKind::call, 9, {{"args", Dictionary{}}}), "\"op\" must be a text"},
      {call("launch:", {}), "unknown operation \"launch:\""},
      {call(operation::kSendMessage, {{"category", "5"}, {"type", 1}}),
       "argument \"category\" must be a number"},
      {call(operation::kSendMessage, {{"category", 5}}), "argument \"type\" must be a number"},
      {call(operation::kSendDictionary, {{"message", 1}}), "argument \"message\" must be a dictionary"},
      {call(operation::kSendOneShot, {{"type", 1}}), "argument \"category\" must be a number"},
      {callFrame(9, operation::kSendMessage, {}, wire::FrameKind::largeCall),
       "a large call is for \"uploadLogData:completionHandler:\" alone"},
      {rawFrame(wire::FrameKind::reply, writeBinaryPropertyList(Dictionary{})), "not of kind 3"},
      {rawFrame(static_cast<wire::FrameKind>(200), ""), "not of kind 200"},
  };
  Door door;
  WireEnd client = door.client();
  for (const auto& [bytes, why] : cases) {
    client.send(bytes);
    const Received reply = client.next();
    EXPECT_EQ(reply.kind, wire::FrameKind::reply);
    EXPECT_EQ(reply.callID, 9u);
    EXPECT_THAT(reply.description(), HasSubstr(why));
  }
  // Without a call id nothing comes back, and what follows is served.
  // Numbers come as they fit; what may be absent and is of another type counts as absent.
  client.send(callFrame(0, "launch:") + callFrame(10, operation::kSendMessage,
                                                  {{"category", 65'543}, {"type", 2.9}, {"payload", "x"}}));
  EXPECT_EQ(client.next().callID, 10u);
  std::vector<std::string> expected(cases.size() + 1, "interrupted");
  expected.push_back("sendMessage 7 2 none");
  EXPECT_EQ(door.journal.lines(), expected);
  EXPECT_EQ(door.counters.value(wire::Reason::call_unreadable), cases.size() + 1);
}

TEST(Replies, CountOnceComeInAnyOrderAndAreNeverOwedForGood) {
  Door door;
  std::vector<wire::SentReply> held;  // the connection's thread's until the journal says so
  door.onMessage = [&](std::uint16_t category, wire::SentReply reply) {
    if (category == 1) return;  // dropped
    if (category == 2) {
      const wire::SentReply copy = reply;
      reply("first", {{"httppost", {wire::Fate::dropped, wire::Reason::no_consent}}, {"uploadserver", {}}});
      return copy("second", {});
    }
    if (category == 3) return reply(std::string(1'200'000, 'x'), {});
    if (category > 4) {
      const auto fate = category == 5 ? wire::Fate::batched : wire::Fate::held;
      return reply(std::nullopt, {{"httppost", {fate, wire::Reason::reports}}});
    }
    held.push_back(std::move(reply));
    if (held.size() == 3) door.journal.add("held");
  };
  WireEnd client = door.client();
  client.send(messageFrame(1, 1) + messageFrame(2, 2) + messageFrame(3, 3) + messageFrame(4, 4) +
              messageFrame(5, 4) + messageFrame(0, 4));
  EXPECT_EQ(client.next().results(), "The daemon gave no reply.");
  EXPECT_EQ(client.next().results(),
            R"({"outcomes":[{"backend":"httppost","outcome":"dropped","reason":"no_consent",)"
            R"("text":"no consent to diagnostic submission"},)"
            R"({"backend":"uploadserver","outcome":"none",)"
            R"("reason":"takes_no_messages","text":"it takes none"}],)"
            R"("reply":"first"})");
  const std::string tooLarge = client.next().description();
  EXPECT_THAT(tooLarge, HasSubstr("The reply of 12000"));
  EXPECT_THAT(tooLarge, HasSubstr("(1048576 bytes)"));
  ASSERT_TRUE(door.journal.waitFor("held"));
  held[1](std::nullopt, {});
  held[0]("late", {});
  EXPECT_FALSE(held[2]);  // no reply was wanted: nothing to call
  EXPECT_EQ(client.next().results(), R"({"outcomes":[]})");
  const Received last = client.next();
  EXPECT_EQ(last.callID, 4u);
  EXPECT_EQ(last.results(), R"({"outcomes":[],"reply":"late"})");
  // Equal ones after each other, others between them.
  client.send(messageFrame(6, 5) + messageFrame(7, 5) + messageFrame(8, 6) + messageFrame(9, 5));
  for (const auto& [callID, fate] :
       {std::pair{6u, "batched"}, {7u, "batched"}, {8u, "held"}, {9u, "batched"}}) {
    const Received next = client.next();
    EXPECT_EQ(next.callID, callID);
    EXPECT_THAT(next.results(), HasSubstr(std::string(R"("outcome":")") + fate));
  }
}

}  // namespace
}  // namespace veltrad::ipc_test
