// What each call becomes at the session and what comes back; what is refused, and with which words.
#include <algorithm>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

struct GoodCall {
  const char* op;
  Dictionary arguments;
  const char* atSession;
  const char* results;
};

TEST(Calls, ReachTheSessionAndAreAnswered) {
  const Dictionary info{{"sessionID", 42}};
  const Dictionary user{{"clientName", "phone"}};
  const std::vector<GoodCall> calls{
      {"setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:",
       {{"sessionInfo", info},
        {"userInfo", user},
        {"frameworksToCheck", Array{"A"}},
        {"hasAggregationBlock", true}},
       "setSessionInfo {sessionID=42} {clientName=phone} [A] aggregating",
       "{}"},
      {"setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:",
       {{"userInfo", "text"}, {"sessionInfo", 1}},
       "setSessionInfo none none none",
       "{}"},
      {"startConfigWithCompletionHandler:", {}, "startConfig", "{backends=[httppost dashboard]}"},
      {"fetchStatesWithUserInfo:completionHandler:",
       {{"userInfo", user}},
       "fetchStates {clientName=phone}",
       "{}"},
      {"fetchDisplayURL:", {}, "fetchDisplayURL", "{reply=done}"},
      {kSend, message(5, 1), "sendMessage 5 1 {codec=opus}", "{reply=done}"},
      {kSend,
       {{"category", 65536 + 7}, {"type", 2.9}, {"payload", "text"}},
       "sendMessage 7 2 none",
       "{reply=done}"},
      {"sendMessageWithDictionary:reply:",
       {{"message", Dictionary{{"flag", 3}}}},
       "sendDictionary {flag=3}",
       "{reply=done}"},
      {"flushMessagesWithCompletion:",
       {},
       "flush",
       "{error={code=-1 description=No backends available to send message domain=com.florn.veltra.error} "
       "reply=flushed}"},
      {"finishSessionWithReply:", {}, "finish", "{reply=done}"},
      {"uploadFileAtPath:extensionToken:completionHandler:",
       {{"path", "/a b"}},
       "uploadFile /a b token ''",
       "{uploaded=true}"},
      {"uploadLogData:completionHandler:",
       {{"data", Array{1, 2, 3}}},
       "uploadLogData of 3",
       "{error={code=403 description=refused domain=com.florn.veltra.error} uploaded=false}"},
      {"sendMessageWithSessionInfo:userInfo:category:type:payload:reply:",
       {{"sessionInfo", info}, {"category", 1}, {"type", 2}},
       "oneShot {sessionID=42} none 1 2 none",
       "{reply=done}"},
  };
  Door door;
  Client client = door.client();
  client.greet();
  std::uint32_t id = 7;
  for (const GoodCall& good : calls) {
    SCOPED_TRACE(good.atSession);
    client.call(++id, good.op, good.arguments);
    const auto reply = client.receive();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->kind, FrameKind::reply);
    EXPECT_EQ(reply->callID, id);
    EXPECT_EQ(reply->results(), good.results);
    EXPECT_EQ(door.journal.lines().back(), good.atSession);
  }
}

TEST(Calls, ThatCannotBeReadSayWhyAndInterruptNothingElse) {
  const auto frame = [](FrameKind kind, std::string_view body) {
    std::string bytes(ipc::kFrameHeaderBytes, '\0');
    ipc::encodeFrameHeader({static_cast<std::uint32_t>(body.size()), kind, 0, 9}, bytes.data());
    return bytes.append(body);
  };
  const auto call = [](const char* op, Dictionary arguments, FrameKind kind = FrameKind::call) {
    return Client::callFrame(9, op, std::move(arguments), kind);
  };
  const std::vector<std::pair<std::string, const char*>> cases{
      {frame(FrameKind::call, ""), "the body is no readable property list"},
      {frame(FrameKind::call, "bplist00 and then rubbish"), "the body is no readable property list"},
      {frame(FrameKind::call, writeBinaryPropertyList(Array{1})), "the body must be a dictionary"},
      {ipc::makeFrame(FrameKind::call, 9, {{"args", Dictionary{}}}), "\"op\" must be a text"},
      {call("launch:", {}), "unknown operation \"launch:\""},
      {call(kSend, {{"category", "5"}, {"type", 1}}), "argument \"category\" must be a number"},
      {call(kSend, {{"category", 5}}), "argument \"type\" must be a number"},
      {call("sendMessageWithDictionary:reply:", {{"message", 1}}),
       "argument \"message\" must be a dictionary"},
      {call("uploadFileAtPath:extensionToken:completionHandler:", {}), "argument \"path\" must be a text"},
      {call("uploadLogData:completionHandler:", {{"data", "x"}}), "argument \"data\" must be an array"},
      {call("sendMessageWithSessionInfo:userInfo:category:type:payload:reply:", {{"type", 1}}),
       "argument \"category\" must be a number"},
      {call(kSend, message(5, 1), FrameKind::largeCall),
       "a large call is for \"uploadLogData:completionHandler:\" alone"},
      {frame(FrameKind::reply, writeBinaryPropertyList(Dictionary{})), "not of kind 3"},
      {frame(static_cast<FrameKind>(200), ""), "not of kind 200"},
  };
  Door door;
  Client client = door.client();
  client.greet();
  for (const auto& [bytes, why] : cases) {
    SCOPED_TRACE(why);
    client.send(bytes);
    const auto reply = client.receive();
    ASSERT_TRUE(reply);
    EXPECT_EQ(reply->kind, FrameKind::reply);
    EXPECT_EQ(reply->callID, 9u);
    EXPECT_NE(reply->description().find(why), std::string::npos) << reply->description();
  }
  // Without a call id nothing comes back, and what follows is served.
  client.call(0, "launch:");
  client.call(10, kSend, message(5, 1));
  EXPECT_EQ(client.receive()->callID, 10u);
  EXPECT_EQ(door.journal.lines().size(), cases.size() + 2);
  EXPECT_EQ(door.counters.value("call refused: it cannot be read"), cases.size() + 1);
  EXPECT_EQ(door.journal.lines().front(), "interrupted");
}

TEST(Calls, OfAPipelineAreRunInOrderHoweverTheirBytesArrive) {
  std::string bytes = Client::helloFrame();
  for (int i = 0; i < 3; ++i)
    bytes += Client::callFrame(i == 1 ? 0 : 100u + static_cast<unsigned>(i), kSend, message(5, i));
  Door door;
  for (std::size_t cut = 0; cut <= bytes.size(); ++cut) {
    Client client = door.client();
    client.send(bytes.substr(0, cut));
    client.waitUntilRead();
    client.send(bytes.substr(cut));
    ASSERT_EQ(client.receive()->kind, FrameKind::hello);
    EXPECT_EQ(client.receive()->callID, 100u);
    EXPECT_EQ(client.receive()->callID, 102u);
  }
  Client single = door.client();
  for (const char byte : bytes) single.send({&byte, 1});
  ASSERT_EQ(single.receive()->kind, FrameKind::hello);
  EXPECT_EQ(single.receive()->callID, 100u);
  EXPECT_EQ(single.receive()->callID, 102u);
}

TEST(Calls, WithLogDataMayBeLarge) {
  Array data;
  for (int i = 0; i < 300; ++i) data.push_back(Dictionary{{"n", i}, {"text", std::string(10'000, 'x')}});
  Door door;
  Client client = door.client();
  client.greet();
  client.call(3, "uploadLogData:completionHandler:", {{"data", data}}, FrameKind::largeCall);
  ASSERT_EQ(client.receive()->callID, 3u);
  EXPECT_EQ(door.journal.lines().back(), "uploadLogData of 300");
}

TEST(Replies, ThatAreNeverGivenEndTheCallWithAnError) {
  Door door;
  std::vector<StringReply> held;
  std::mutex mutex;
  door.onMessage = [&](std::uint16_t category, StringReply reply) {
    std::lock_guard lock(mutex);
    if (category == 1) return;  // dropped
    if (category == 2) {        // given twice, by two copies
      const StringReply copy = reply;
      reply("first");
      copy("second");
      return;
    }
    held.push_back(std::move(reply));
    door.journal.add("held " + std::to_string(held.size()));
  };
  Client client = door.client();
  client.greet();
  client.call(1, kSend, message(1, 0));
  EXPECT_EQ(client.receive()->results(), "error: The daemon gave no reply.");
  client.call(2, kSend, message(2, 0));
  client.call(3, kSend, message(3, 0));
  client.call(4, kSend, message(4, 0));
  EXPECT_EQ(client.receive()->results(), "{reply=first}");
  ASSERT_TRUE(door.journal.waitFor("held 2"));
  {
    std::lock_guard lock(mutex);
    ASSERT_EQ(held.size(), 2u);
    held[1](std::nullopt);  // another thread, another order
    held[0]("late");
  }
  const auto fourth = client.receive();
  EXPECT_EQ(fourth->callID, 4u);
  EXPECT_EQ(fourth->results(), "{}");
  EXPECT_EQ(client.receive()->results(), "{reply=late}");
  client.call(0, kSend, message(5, 0));
  client.close();
  ASSERT_TRUE(door.journal.waitFor("end"));
  std::lock_guard lock(mutex);
  EXPECT_FALSE(held.at(2));  // no reply was wanted: nothing to call
  held.clear();
}

TEST(Replies, MayOutliveTheConnectionAndTheDoor) {
  StringReply late;
  {
    Door door;
    door.onMessage = [&](std::uint16_t, StringReply reply) { late = std::move(reply); };
    Client client = door.client();
    client.greet();
    client.call(1, kSend, message(1, 1));
    client.stopWriting();
    EXPECT_TRUE(door.journal.waitFor("end"));
    EXPECT_TRUE(client.atEnd());
    EXPECT_EQ(door.stop(), 0u);
    late("nobody is there");
    EXPECT_EQ(door.counters.value("reply dropped: the client has gone"), 1u);
    late = nullptr;
  }
}

TEST(Replies, BeyondAFramesSizeAreErrorsThatNameBothSizes) {
  Door door;
  door.onMessage = [](std::uint16_t, StringReply reply) { reply(std::string(1'200'000, 'x')); };
  Client client = door.client();
  client.greet();
  client.call(1, kSend, message(1, 1));
  const auto reply = client.receive();
  ASSERT_TRUE(reply);
  EXPECT_NE(reply->description().find("The reply of 12000"), std::string::npos) << reply->description();
  EXPECT_NE(reply->description().find("(1048576 bytes)"), std::string::npos) << reply->description();
  client.call(2, kSend, message(1, 1));
  EXPECT_EQ(client.receive()->callID, 2u);
}

}  // namespace
}  // namespace veltrad::ipc_test
