// What becomes of calls when the daemon does not read, goes away, or the session is closed.
#include <atomic>
#include <thread>

#include "sessions.h"

namespace veltrad::test {
namespace {

using ::testing::Each;

veltra_statistics countsOf(const SessionPointer& session) {
  veltra_statistics counts;
  veltra_session_statistics(session.get(), &counts);
  return counts;
}

// A payload that fills queues with few calls.
std::unique_ptr<veltra_value, void (*)(const veltra_value*)> bulk(std::size_t bytes) {
  veltra_value* payload = veltra_dictionary();
  veltra_dictionary_set(payload, "bulk", veltra_data(std::string(bytes, 'b').data(), bytes));
  return {payload, veltra_release};
}

TEST(ConnectionEnd, ADaemonThatDoesNotReadFillsTheQueueAndLosesNothingThatWasAccepted) {
  Gate reading;
  std::atomic<unsigned> received{0};
  std::atomic<bool> inOrder{true};
  FakeDaemon daemon([&](Link& link) {
    if (!link.greet() || !link.nextCall()) return;
    reading.wait();
    while (const auto call = link.nextCall()) {
      if (call->args.uint16("type") != static_cast<std::uint16_t>(received)) inOrder = false;
      ++received;
      if (call->id != 0) answerPlainly(link, *call);
    }
  });
  auto options = optionsFor(daemon.root());
  options.queue_bytes = 300'000;
  SessionPointer session = open(options);
  const auto payload = bulk(10'000);
  uint16_t accepted = 0;
  veltra_status status;
  while ((status = veltra_session_send(session.get(), 1, accepted, payload.get(), 0, nullptr, nullptr)) ==
         VELTRA_OK) {
    ASSERT_LT(++accepted, 10'000);
  }
  EXPECT_EQ(status, VELTRA_QUEUE_FULL);
  const auto counts = countsOf(session);
  EXPECT_EQ(counts.dropped, 1u);
  EXPECT_GE(counts.queued, 20u);
  EXPECT_LE(counts.queued * 10'000, 310'000u);
  EXPECT_EQ(counts.sent + counts.queued, accepted);
  EXPECT_EQ(veltra_session_send(session.get(), 1, 1, payload.get(), 0, Collected::callback, nullptr),
            VELTRA_QUEUE_FULL);

  reading.open();
  // A waiting call finds room as soon as there is some, and goes behind what waits.
  veltra_reply* reply = nullptr;
  while ((status = veltra_session_send_wait(session.get(), 7, accepted, nullptr, 0, &reply)) ==
         VELTRA_QUEUE_FULL) {
    veltra_reply_release(reply);
    std::this_thread::yield();
  }
  EXPECT_EQ(status, VELTRA_OK);
  EXPECT_EQ(textOf(reply), "7/" + std::to_string(accepted));
  veltra_reply_release(reply);
  EXPECT_EQ(received, accepted + 1u);
  EXPECT_TRUE(inOrder);
  EXPECT_EQ(veltra_session_close(session.release()), 0u);
}

TEST(ConnectionEnd, EndsEveryCallOnceWhenTheDaemonGoes) {
  Gate go;
  FakeDaemon daemon([&](Link& link) {
    if (!link.greet()) return;
    std::uint32_t first = 0;
    for (int wanted = 12; wanted > 0;) {
      const auto call = link.nextCall();
      if (!call) return;
      if (call->id != 0) --wanted;
      if (first == 0) first = call->id;
    }
    go.wait();
    link.reply(first, Dictionary{{"reply", "the last word"}});  // still to be read behind the end
  });
  SessionPointer session = open(daemon);
  Collected ended;
  for (int i = 0; i < 8; ++i) {
    ASSERT_EQ(veltra_session_send(session.get(), 1, 1, nullptr, 0, Collected::callback, &ended), VELTRA_OK);
  }
  std::vector<std::thread> waiters;
  for (int i = 0; i < 4; ++i) {
    waiters.emplace_back([&] {
      const auto reply =
          waited(VELTRA_NO_REPLY, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
      EXPECT_EQ(describe(reply.get()), "The connection to the daemon ended before the answer came.");
    });
  }
  go.open();
  for (std::thread& waiter : waiters) waiter.join();
  auto texts = ended.waitFor(8);
  ASSERT_EQ(texts.size(), 8u);
  EXPECT_EQ(texts[0], "the last word");
  texts.erase(texts.begin());
  EXPECT_THAT(texts, Each("The connection to the daemon ended before the answer came."));

  EXPECT_EQ(veltra_session_send(session.get(), 1, 1, nullptr, 0, Collected::callback, &ended),
            VELTRA_NO_DAEMON);
  const auto reply =
      waited(VELTRA_NO_DAEMON, [&](auto r) { return veltra_session_start_wait(session.get(), r); });
  EXPECT_EQ(describe(reply.get()), "No daemon listens, or the connection to it has ended.");
  const auto counts = countsOf(session);
  EXPECT_EQ(counts.replies, 1u);
  EXPECT_EQ(counts.unanswered, 11u);
  EXPECT_EQ(counts.sent, 12u);
  EXPECT_EQ(counts.dropped, 2u);
  EXPECT_EQ(veltra_session_close(session.release()), 0u);
  EXPECT_EQ(ended.waitFor(8).size(), 8u);
}

TEST(ConnectionEnd, AFrameOfImpossibleLengthOrALateRefusalEndsIt) {
  for (const std::string& bytes : {std::string("\xff\xff\xff\xff\x03\0\0\0\0\0\0\1", 12),
                                   ipc::makeFrame(ipc::FrameKind::refusal, 0, Dictionary{})}) {
    FakeDaemon daemon([&](Link& link) {
      if (!link.greet()) return;
      while (const auto call = link.nextCall()) {
        if (call->id != 0) link.send(bytes);
      }
    });
    SessionPointer session = open(daemon);
    waited(VELTRA_NO_REPLY, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
    EXPECT_EQ(veltra_session_flush(session.get(), nullptr, nullptr), VELTRA_NO_DAEMON);
  }
}

TEST(ConnectionEnd, ReadsAnswersThatComeInPiecesOrBehindOnesThatNobodyAwaits) {
  FakeDaemon daemon(answering([](Link& link, const ReceivedCall& call) {
    if (call.id == 0) return;
    link.reply(call.id + 1000, Dictionary{{"reply", "of nobody"}});
    const std::string frame = ipc::makeFrame(ipc::FrameKind::reply, call.id,
                                             Dictionary{{"results", Dictionary{{"reply", "in pieces"}}}});
    for (const char byte : frame) link.send(std::string_view(&byte, 1));
  }));
  SessionPointer session = open(daemon);
  const auto reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
  EXPECT_EQ(textOf(reply.get()), "in pieces");
  Collected collected;
  ASSERT_EQ(veltra_session_flush(session.get(), Collected::callback, &collected), VELTRA_OK);
  EXPECT_EQ(collected.waitFor(1)[0], "in pieces");
}

TEST(ConnectionEnd, ClosingWritesOutWhatWaitsAndEndsWhatIsUnanswered) {
  Gate reading;
  std::atomic<int> received{0};
  Collected ended;
  {
    FakeDaemon daemon([&](Link& link) {
      if (!link.greet() || !link.nextCall()) return;
      reading.wait();
      while (link.nextCall()) ++received;
    });
    SessionPointer session = open(daemon);
    const auto payload = bulk(20'000);
    int accepted = 0;
    while (countsOf(session).queued < 10) {
      ++accepted;
      ASSERT_EQ(veltra_session_send(session.get(), 1, 1, payload.get(), 0, Collected::callback, &ended),
                VELTRA_OK);
    }
    std::thread closer([&] { EXPECT_EQ(veltra_session_close(session.release()), 0u); });
    reading.open();
    closer.join();
    EXPECT_EQ(ended.waitFor(0).size(), static_cast<std::size_t>(accepted));
    EXPECT_THAT(ended.waitFor(0), Each("The connection to the daemon ended before the answer came."));
  }
  EXPECT_EQ(static_cast<std::size_t>(received), ended.waitFor(0).size());
}

TEST(ConnectionEnd, ClosingGivesUpAfterTwoSecondsAndSaysWhatWasLost) {
  Gate done;
  FakeDaemon daemon([&](Link& link) {
    if (link.greet()) done.wait();
  });
  SessionPointer session = open(daemon);
  const auto payload = bulk(20'000);
  while (countsOf(session).queued < 10) {
    ASSERT_EQ(veltra_session_send(session.get(), 1, 1, payload.get(), 0, nullptr, nullptr), VELTRA_OK);
  }
  const auto begun = std::chrono::steady_clock::now();
  EXPECT_EQ(veltra_session_close(session.release()), 10u);
  const auto taken = std::chrono::steady_clock::now() - begun;
  EXPECT_GE(taken, std::chrono::milliseconds(1900));
  EXPECT_LT(taken, std::chrono::seconds(10));
  done.open();
}

TEST(ConnectionEnd, ClosingEndsThreadsThatWait) {
  Collected asked;
  FakeDaemon daemon([&](Link& link) {
    if (!link.greet()) return;
    while (const auto call = link.nextCall()) {
      if (call->id != 0) asked.add(call->op);
    }
  });
  SessionPointer session = open(daemon);
  veltra_session* shared = session.release();
  std::vector<std::thread> waiters;
  for (int i = 0; i < 3; ++i) {
    waiters.emplace_back(
        [shared] { EXPECT_EQ(veltra_session_flush_wait(shared, nullptr), VELTRA_NO_REPLY); });
  }
  asked.waitFor(3);
  EXPECT_EQ(veltra_session_close(shared), 0u);
  for (std::thread& waiter : waiters) waiter.join();
}

}  // namespace
}  // namespace veltrad::test
