// What each call becomes at the session and what comes back; what is refused, and with which words.
#include "harness.h"

namespace veltrad::ipc_test {
namespace {

TEST(Calls, ReachTheSessionAndAreAnswered) {
  const char* setSessionInfo = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:";
  const char* done = R"({"reply":"done"})";
  const std::string large = R"({"data":[")" + std::string(3'000'000, 'x') + R"(",2,3]})";
  struct Case {
    const char* op;
    std::string_view arguments;
    const char* atSession;
    const char* results;
  };
  const Case cases[] = {
      {setSessionInfo,
       R"({"sessionInfo":{"n":1},"userInfo":{"n":2},"frameworksToCheck":["A"],"hasAggregationBlock":1})",
       R"(setSessionInfo {"n":1} {"n":2} ["A"] true)", "{}"},
      {setSessionInfo, R"({"userInfo":"x","sessionInfo":1})", "setSessionInfo none none none false", "{}"},
      {"startConfigWithCompletionHandler:", "{}", "startConfig", R"({"backends":["httppost","dashboard"]})"},
      {"fetchStatesWithUserInfo:completionHandler:", R"({"userInfo":{"n":1}})", R"(fetchStates {"n":1})",
       "{}"},
      {"fetchDisplayURL:", "{}", "fetchDisplayURL", R"({"reply":"https://x/"})"},
      {kSend, R"({"category":5,"type":1,"payload":{"n":1}})", R"(sendMessage 5 1 {"n":1})", done},
      {kSend, R"({"category":65543,"type":2.9,"payload":"x"})", "sendMessage 7 2 none", done},
      {"sendMessageWithDictionary:reply:", R"({"message":{"n":1}})", R"(sendDictionary {"n":1})", done},
      {"flushMessagesWithCompletion:", "{}", "flush",
       R"({"error":{"code":-1,"description":"No backends","domain":"com.florn.veltra.error"},"reply":"flushed"})"},
      {"finishSessionWithReply:", "{}", "finish", R"({"reply":"finished"})"},
      {kUploadFile, R"({"path":"/a b"})", R"(uploadFile "/a b" "")", R"({"uploaded":true})"},
      {kUploadLogData, large, "uploadLogData of 3",
       R"({"error":{"code":403,"description":"refused","domain":"com.florn.veltra.error"},"uploaded":false})"},
      {kOneShot, R"({"sessionInfo":{"n":1},"category":1,"type":2})", R"(oneShot {"n":1} none 1 2 none)",
       done},
  };
  Door door;
  WireEnd client = door.client();
  std::uint32_t call = 7;
  for (const Case& each : cases) {
    SCOPED_TRACE(each.atSession);
    client.send(callFrame(++call, each.op, *parseJSON(each.arguments).value().asDictionary(),
                          each.op == kUploadLogData ? FrameKind::largeCall : FrameKind::call));
    const Received reply = client.next();
    EXPECT_EQ(reply.kind, FrameKind::reply);
    EXPECT_EQ(reply.callID, call);
    EXPECT_EQ(reply.results(), each.results);
    EXPECT_EQ(door.journal.lines().back(), each.atSession);
  }
}

TEST(Calls, ThatCannotBeReadSayWhyAndInterruptNothingElse) {
  const auto call = [](const char* op, Dictionary arguments) {
    return callFrame(9, op, std::move(arguments));
  };
  const std::vector<std::pair<std::string, const char*>> cases{
      {rawFrame(FrameKind::call, ""), "the body is no readable property list"},
      {rawFrame(FrameKind::call, "bplist00 and then rubbish"), "the body is no readable property list"},
      {rawFrame(FrameKind::call, writeBinaryPropertyList(Array{1})), "the body must be a dictionary"},
      {ipc::makeFrame(FrameKind::call, 9, {{"args", Dictionary{}}}), "\"op\" must be a text"},
      {call("launch:", {}), "unknown operation \"launch:\""},
      {call(kSend, {{"category", "5"}, {"type", 1}}), "argument \"category\" must be a number"},
      {call(kSend, {{"category", 5}}), "argument \"type\" must be a number"},
      {call("sendMessageWithDictionary:reply:", {{"message", 1}}),
       "argument \"message\" must be a dictionary"},
      {call(kOneShot, {{"type", 1}}), "argument \"category\" must be a number"},
      {callFrame(9, kSend, {}, FrameKind::largeCall),
       "a large call is for \"uploadLogData:completionHandler:\" alone"},
      {rawFrame(FrameKind::reply, writeBinaryPropertyList(Dictionary{})), "not of kind 3"},
      {rawFrame(static_cast<FrameKind>(200), ""), "not of kind 200"},
  };
  Door door;
  WireEnd client = door.client();
  for (const auto& [bytes, why] : cases) {
    client.send(bytes);
    const Received reply = client.next();
    EXPECT_EQ(reply.kind, FrameKind::reply);
    EXPECT_EQ(reply.callID, 9u);
    EXPECT_THAT(reply.description(), HasSubstr(why));
  }
  // Without a call id nothing comes back, and what follows is served.
  client.send(callFrame(0, "launch:") + messageFrame(10));
  EXPECT_EQ(client.next().callID, 10u);
  std::vector<std::string> expected(cases.size() + 1, "interrupted");
  expected.push_back("sendMessage 1 1 none");
  EXPECT_EQ(door.journal.lines(), expected);
  EXPECT_EQ(door.counters.value("call refused: it cannot be read"), cases.size() + 1);
}

TEST(Calls, OfAPipelineAreRunInOrderHoweverTheirBytesArrive) {
  const std::string bytes = helloFrame() + messageFrame(100) + messageFrame(0) + messageFrame(102);
  Door door;
  const auto expectAnswers = [](WireEnd& client) {
    for (const std::uint32_t id : {0u, 100u, 102u}) EXPECT_EQ(client.next().callID, id);
  };
  for (std::size_t cut = 0; cut <= bytes.size(); ++cut) {
    WireEnd client = door.stranger();
    client.send(bytes.substr(0, cut));
    client.waitUntilRead();
    client.send(bytes.substr(cut));
    expectAnswers(client);
  }
  WireEnd client = door.stranger();
  for (const char byte : bytes) client.send({&byte, 1});
  expectAnswers(client);
}

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
