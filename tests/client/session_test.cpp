// Sessions against a scripted daemon: calls out and answers in, one after the other and many at once.
#include "harness.h"

namespace veltrad::client_test {
namespace {

std::string eventFrame(const char* op, Dictionary args) {
  return wire::makeFrame(wire::FrameKind::event, 0, {{"op", op}, {"args", std::move(args)}});
}

TEST(Session, CarriesAWholeConversation) {
  Journal calls;
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    calls.add(call.op() + (call.callID == 0 ? " without reply " : " ") + formats::writeJSON(call.args()));
    if (call.op() != operation::kFlushMessages) return answerPlainly(link, call);
    // In one write with the answer, so that the waiting thread finds them.
    const Dictionary args{{"sessionInfo", Dictionary{{"sessionID", 8}}},
                          {"timestamp", 12.25},
                          {"category", 65535},
                          {"type", 2},
                          {"payload", Dictionary{{"k", Array{1, "two"}}}}};
    link.send(eventFrame(wire::event::kSendMessageToClient, args) + eventFrame("somethingElse:", {}) +
              eventFrame(wire::event::kSendMessageToClient, {}) + replyFrame(call.callID, {}));
  });
  Journal copies;
  const auto copied = [&](const veltra::Aggregated& copy) {
    copies.add(std::to_string(copy.timestamp) + " " + std::to_string(copy.category + copy.type) + " " +
               std::to_string(copy.sessionInfo.item("sessionID").asUnsigned()) + " " +
               std::string(copy.payload.item("k").item(1).string().value_or("(none)")));
  };
  veltra::Session session{{.clientType = -3,
                           .sessionID = 4'000'000'000u,
                           .clientVersion = 65535,
                           .clientName = "pho\xffne",
                           .serviceName = "ringer",
                           .userInfo = veltra::Dictionary{{"clientName", "overruled"}, {"build", 9u}},
                           .batchEvents = true,
                           .aggregated = copied,
                           .root = daemon.root.directory()}};
  ASSERT_TRUE(session) << session.error().description;
  EXPECT_THAT(**session.start(), ElementsAre("dashboard", "httppost"));
  EXPECT_EQ(session.send(5, 65535, {{"codec", "opus"}, {"seconds", 12.5}}).get().text, "5/65535");
  EXPECT_EQ(session.post(5, 2, {{"codec", "opus"}}, 3), VELTRA_OK);
  EXPECT_TRUE(session.send({{"category", 5}, {"flag", 2}}).get());
  EXPECT_TRUE(session.sendAndWait(5, 4, {{"at", veltra::Date{7}}, {"raw", veltra::Data{"\1\2"}}}));
  EXPECT_EQ(*session.displayURL(), "fetchDisplayURL:");
  EXPECT_TRUE(session.states(veltra::Dictionary{{"list", veltra::Array{1, "two", true}}}));
  const veltra::Options other{.sessionID = 3, .clientName = "lamp", .requireUserInfo = true};
  EXPECT_TRUE(session.sendOneShot(other, 1, 2, {{"k", "v"}}).get());
  EXPECT_TRUE(session.flush());
  ASSERT_TRUE(copies.waitForLines(2));
  EXPECT_THAT(copies.lines(), ElementsAre("12.250000 65537 8 two", "0.000000 0 0 (none)"));
  EXPECT_TRUE(session.finish());
  veltra::Session moved = std::move(session);
  EXPECT_EQ(moved.statistics().replies, 9u);
  EXPECT_EQ(moved.close(), 0u);
  EXPECT_THAT(
      calls.lines(),
      ElementsAre("setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock: without reply "
                  R"({"hasAggregationBlock":true,"sessionInfo":{"batchEvent":true,"clientType":-3,)"
                  R"("clientVersion":65535,"requireUserInfo":false,"sessionID":4000000000},)"
                  R"("userInfo":{"build":9,"clientName":"pho�ne","serviceName":"ringer"}})",
                  "startConfigWithCompletionHandler: {}",
                  R"(sendMessageWithCategory:type:payload:reply: )"
                  R"({"category":5,"payload":{"codec":"opus","seconds":12.5},"type":65535})",
                  R"(sendMessageWithDictionary:reply: without reply )"
                  R"({"message":{"category":5,"flag":3,"payload":{"codec":"opus"},"type":2}})",
                  R"(sendMessageWithDictionary:reply: {"message":{"category":5,"flag":2}})",
                  R"(sendMessageWithCategory:type:payload:reply: )"
                  R"({"category":5,"payload":{"at":{"$date":7.0},"raw":{"$data":"AQI="}},"type":4})",
                  "fetchDisplayURL: {}",
                  R"(fetchStatesWithUserInfo:completionHandler: {"userInfo":{"list":[1,"two",true]}})",
                  "sendMessageWithSessionInfo:userInfo:category:type:payload:reply: "
                  R"({"category":1,"payload":{"k":"v"},"sessionInfo":{"batchEvent":false,)"
                  R"("requireUserInfo":true,"sessionID":3},"type":2,"userInfo":{"clientName":"lamp"}})",
                  "flushMessagesWithCompletion: {}", "finishSessionWithReply: {}"));
}

TEST(Session, CarriesCallsOutInTheOrderInWhichTheyWereMadeAndGivesEachItsOwnAnswer) {
  constexpr std::uint16_t kCalls = 600;
  std::vector<int> order;
  std::optional<Received> kept;
  // Answers in pairs, the later one first; every third call asks for no answer.
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() != operation::kSendMessage) return;
    order.push_back(*call.args().uint16("type"));
    if (call.callID == 0) return;
    if (!kept) return void(kept = call);
    answerPlainly(link, call);
    answerPlainly(link, *std::exchange(kept, std::nullopt));
  });
  veltra::Session session = open(daemon);
  Journal answers;
  std::vector<std::string> expected;
  for (std::uint16_t i = 0; i < kCalls; ++i) {
    const std::string name = "9/" + std::to_string(i);
    const auto callback = [&answers, name](const veltra::Reply& reply) {
      answers.add(name);
      EXPECT_EQ(reply.text, name);
    };
    ASSERT_EQ(session.send(9, i, {}, i % 3 == 0 ? veltra::Callback{} : callback), VELTRA_OK);
    if (i % 3 == 1) expected.push_back(name);
    if (i % 3 == 2) expected.insert(expected.end() - 1, name);
  }
  ASSERT_TRUE(answers.waitForLines(kCalls / 3 * 2));
  const veltra::Statistics counts = session.statistics();
  EXPECT_EQ(counts.sent, kCalls);
  EXPECT_EQ(counts.replies, kCalls / 3u * 2u);
  EXPECT_EQ(counts.dropped + counts.queued + counts.unanswered, 0u);
  session.close();
  EXPECT_EQ(answers.lines(), expected);
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST(Session, ServesThreadsThatWaitAndCallbacksAndEventsAtTheSameTime) {
  constexpr int kThreads = 6;
  constexpr int kRounds = 200;
  FakeDaemon daemon([](WireEnd& link, const Received& call) {
    if (call.callID != 0 && call.callID % 5 == 0)
      link.send(eventFrame(wire::event::kSendMessageToClient, {}));
    answerPlainly(link, call);
  });
  std::atomic<int> events{0};
  std::atomic<int> answered{0};
  veltra::Session session{
      {.aggregated = [&](const veltra::Aggregated&) { ++events; }, .root = daemon.root.directory()}};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kRounds; ++i) {
        const auto count = [&](const veltra::Reply& reply) { answered += reply.text == "1/1"; };
        ASSERT_EQ(session.send(1, 1, {}, count), VELTRA_OK);
        const auto type = static_cast<std::uint16_t>(t * kRounds + i);
        ASSERT_EQ(textOf(session.sendAndWait(2, type, {})), "2/" + std::to_string(type));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(session.statistics().sent, 2u * kThreads * kRounds);
  session.close();
  EXPECT_EQ(answered, kThreads * kRounds);
  EXPECT_EQ(events, 2 * kThreads * kRounds / 5);
}

TEST(Session, RefusesAWaitInsideACallbackAndServesOthersWhileItTakesLong) {
  FakeDaemon daemon(answerPlainly);
  struct Inside {
    Handle session;
    Gate entered;
    Gate leave;
  } inside{openHandle(daemon), {}, {}};
  const auto callback = [](void* context, const veltra_reply*) {
    auto& mine = *static_cast<Inside*>(context);
    veltra_reply* reply = nullptr;
    EXPECT_EQ(veltra_session_flush_wait(mine.session.get(), &reply), VELTRA_WOULD_DEADLOCK);
    EXPECT_STREQ(veltra_reply_error_description(reply),
                 "A waiting call inside a callback would wait for itself.");
    veltra_reply_release(reply);
    EXPECT_EQ(veltra_session_close(mine.session.get()), 0u);
    EXPECT_EQ(veltra_session_flush(mine.session.get(), nullptr, nullptr), VELTRA_OK);
    mine.entered.open();
    mine.leave.pass();
  };
  ASSERT_EQ(veltra_session_start(inside.session.get(), callback, &inside), VELTRA_OK);
  inside.entered.pass();
  EXPECT_EQ(veltra_session_send_wait(inside.session.get(), 3, 4, nullptr, 0, nullptr), VELTRA_OK);
  inside.leave.open();
  inside.session.reset();  // before what its callback uses
}

}  // namespace
}  // namespace veltrad::client_test
