// SPDX-License-Identifier: Apache-2.0
// Sessions against a scripted daemon: calls out and answers in, one after the other and many at once.
#include "harness.h"

namespace veltrad::client_test {
namespace {

std::string eventFrame(const char* op, Dictionary args) {
  return wire::makeFrame(wire::FrameKind::event, 0, {{"op", op}, {"args", std::move(args)}});
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

TEST(Session, LearnsWhatBecameOfAMessageUnlessTheDaemonIsOlder) {
  const Dictionary outcome{
      {"backend", "httppost"}, {"outcome", "dropped"}, {"reason", "no_consent"}, {"text", "why"}};
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.callID == 0) return;
    link.send(replyFrame(call.callID, call.args().uint16("category") == 1
                                          ? Dictionary{{"outcomes", Array{outcome, Dictionary{}}}}
                                          : Dictionary{{"outcomes", "none"}}));
  });
  veltra::Session session = open(daemon);
  const auto outcomes = session.sendAndWait(1, 1, {}).outcomes;
  ASSERT_TRUE(outcomes);
  ASSERT_EQ(outcomes->size(), 2u);
  const auto& [backend, what, reason, text] = outcomes->front();
  EXPECT_THAT((std::vector{backend, what, reason, text}),
              ElementsAre("httppost", "dropped", "no_consent", "why"));
  EXPECT_EQ(outcomes->back().backend, "");
  EXPECT_FALSE(session.sendAndWait(2, 1, {}).outcomes);
}

}  // namespace
}  // namespace veltrad::client_test
