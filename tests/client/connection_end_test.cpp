// SPDX-License-Identifier: Apache-2.0
// Calls when the daemon does not read or ends, or when the session is closed.
#include "harness.h"

namespace veltrad::client_test {
namespace {

// A payload that fills queues with few calls.
veltra::Dictionary bulk(std::size_t bytes) {
  return {{"bulk", veltra::Data{std::string(bytes, 'b')}}};
}

TEST(ConnectionEnd, ADaemonThatDoesNotReadFillsTheQueueAndLosesNothingThatWasAccepted) {
  Gate reading;
  std::atomic<unsigned> received{0};
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() != operation::kSendMessage) return reading.pass();
    EXPECT_EQ(call.args().uint16("type"), received);
    ++received;
    answerPlainly(link, call);
  });
  veltra::Session session = open(daemon, 300'000);
  const auto payload = bulk(10'000);
  std::uint16_t accepted = 0;
  veltra_status status;
  while ((status = session.post(1, accepted, payload)) == VELTRA_OK) ASSERT_LT(++accepted, 10'000);
  EXPECT_EQ(status, VELTRA_QUEUE_FULL);
  const veltra::Statistics counts = session.statistics();
  EXPECT_EQ(counts.dropped, 1u);
  EXPECT_GE(counts.queued, 20u);
  EXPECT_LE(counts.queued * 10'000, 310'000u);
  EXPECT_EQ(counts.sent + counts.queued, accepted);
  EXPECT_EQ(session.send(1, 1, payload, [](auto&) { ADD_FAILURE(); }), VELTRA_QUEUE_FULL);

  reading.open();
  // A waiting call finds room as soon as there is some, and goes behind what waits.
  veltra::Reply reply;
  do {
    reply = session.sendAndWait(7, accepted, {});
  } while (reply.status == VELTRA_QUEUE_FULL);
  EXPECT_EQ(textOf(reply), "7/" + std::to_string(accepted));
  EXPECT_EQ(received, accepted + 1u);
  EXPECT_EQ(session.close(), 0u);
}

TEST(ConnectionEnd, ClosingGivesUpAfterTwoSecondsAndEndsWhatIsUnanswered) {
  Gate done;
  std::atomic<std::size_t> ended{0};
  FakeDaemon daemon([&](auto&...) { done.pass(); });
  veltra::Session session = open(daemon);
  const auto payload = bulk(20'000);
  std::size_t accepted = 0;
  for (; session.statistics().queued < 10; ++accepted)
    ASSERT_EQ(session.send(1, 1, payload, [&](const auto& reply) { ended += textOf(reply) == kEnded; }),
              VELTRA_OK);
  const auto begun = std::chrono::steady_clock::now();
  EXPECT_EQ(session.close(), 10u);
  const auto taken = std::chrono::steady_clock::now() - begun;
  EXPECT_GE(taken, std::chrono::milliseconds(1900));
  EXPECT_LT(taken, std::chrono::seconds(10));
  EXPECT_EQ(ended, accepted);
  done.open();
}

}  // namespace
}  // namespace veltrad::client_test
