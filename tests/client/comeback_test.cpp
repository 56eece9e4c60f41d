// SPDX-License-Identifier: Apache-2.0
// A session whose daemon goes away and comes back, and one in a forked child.
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <iterator>

#include "harness.h"

#ifndef __has_feature
#define __has_feature(feature) 0  // GCC
#endif

namespace veltrad::client_test {
namespace {

using ::testing::HasSubstr;
using ::testing::SizeIs;
using ::testing::StartsWith;

std::string goodbyeFrame(std::uint64_t calls) {
  return wire::makeFrame(wire::FrameKind::event, 0,
                         {{"op", wire::event::kGoodbye}, {"args", Dictionary{{"calls", calls}}}});
}

std::string copyFrame(Dictionary args) {
  return wire::makeFrame(wire::FrameKind::event, 0,
                         {{"op", wire::event::kSendMessageToClient}, {"args", std::move(args)}});
}

std::string described(const Received& call) {
  const Dictionary args = call.args();
  const Dictionary* userInfo = args.dictionary("userInfo");
  return call.op() == operation::kSetSessionInfo
             ? "described " + (userInfo ? formats::writeJSON(*userInfo) : std::string("without user info"))
         : call.op() == operation::kStartConfig ? "started"
         : call.op() == operation::kSendMessage ? "message " + std::to_string(*args.uint16("type"))
                                                : call.op();
}

constexpr const char* kStates[] = {"connecting", "connected", "started", "lost", "closed"};

struct Watched {
  Journal states;
  veltra::StateHandler handler() {
    return [this](veltra_connection_state state, const veltra::Backends& backends, const std::string& why) {
      std::string line = kStates[state];
      if (backends) line += " with " + std::to_string(backends->size());
      states.add(why.empty() ? line : line + ": " + why);
    };
  }
};

// The daemon runs the first three calls of the first connection, the description and two messages, reads two
// more messages, and says goodbye.
TEST(Comeback, DescribesAndStartsAnewAndCountsWhatWasLost) {
  Journal journal;
  Gate silent;
  std::atomic<int> connection{0}, calls{0};
  Watched watched;
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() == operation::kSetSessionInfo) ++connection;
    const bool first = connection == 1;
    if (!first || ++calls <= 4) journal.add(described(call));
    if (!first) return answerPlainly(link, call);
    if (calls <= 3) answerPlainly(link, call);
    if (calls < 6) return;
    link.send(goodbyeFrame(4));
    link.hangUp();
  });
  veltra::Session session{
      {.clientName = "phone", .root = daemon.root.directory(), .stateChanged = watched.handler()}};
  ASSERT_TRUE(session);
  ASSERT_TRUE(session.start());
  ASSERT_TRUE(session.states(veltra::Dictionary{{"clientName", "lamp"}}));
  // Of three messages under way the daemon says that it has run the first one.
  std::vector<std::future<veltra::Reply>> under;
  for (std::uint16_t type = 1; type <= 3; ++type) under.push_back(session.send(5, type));
  for (auto& reply : under) EXPECT_EQ(textOf(reply.get()), kEnded);
  ASSERT_TRUE(watched.states.waitFor("lost: The daemon has stopped."));
  EXPECT_EQ(session.counter(VELTRA_COUNTER_LOST), 2u);
  for (std::uint16_t type = 4; type <= 5; ++type) EXPECT_EQ(session.post(5, type), VELTRA_OK);
  EXPECT_EQ(textOf(session.sendAndWait(5, 6, {})), "5/6");
  EXPECT_THAT(
      journal.lines(),
      ElementsAre(R"(described {"clientName":"phone"})", "started", operation::kFetchStates, "message 1",
                  R"(described {"clientName":"lamp"})", "started", "message 4", "message 5", "message 6"));
  EXPECT_EQ(session.counter(VELTRA_COUNTER_CONNECTIONS), 2u);
  EXPECT_EQ(session.close(), 0u);
  EXPECT_THAT(watched.states.lines(),
              ElementsAre("connected", "started with 2", "lost: The daemon has stopped.", "connecting",
                          "connected", "started with 2", "closed"));
}

TEST(Comeback, CountsAsLostWhatADaemonThatWasKilledMayNotHaveRun) {
  std::atomic<int> messages{0};
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() != operation::kSendMessage) return;
    if (++messages <= 2) answerPlainly(link, call);
    if (messages == 4) link.hangUp();
  });
  veltra::Session session = open(daemon);
  std::vector<std::future<veltra::Reply>> under;
  for (int i = 0; i < 4; ++i) under.push_back(session.send(5, 1));
  for (auto& reply : under) reply.wait();
  EXPECT_EQ(session.counter(VELTRA_COUNTER_LOST), 2u);
  EXPECT_EQ(session.statistics().unanswered, 2u);
}

TEST(Comeback, ACreateThatDoesNotWaitQueuesAndSaysWhyThereIsNoDaemon) {
  TemporaryRoot root;
  Watched watched;
  veltra::Session session{{.root = root.directory(),
                           .queueBytes = 2'000,
                           .connectLater = true,
                           .connectTimeout = std::chrono::milliseconds(150),
                           .stateChanged = watched.handler()}};
  ASSERT_TRUE(session);
  // A waiting call gives up after the timeout, and is not sent later.
  EXPECT_EQ(session.sendAndWait(5, 99, {}).status, VELTRA_NO_DAEMON);
  EXPECT_EQ(session.start(nullptr), VELTRA_OK);
  std::uint64_t queued = 0;
  veltra_status status;
  while ((status = session.post(5, 1)) == VELTRA_OK) ASSERT_LT(++queued, 100u);
  EXPECT_EQ(status, VELTRA_QUEUE_FULL);
  EXPECT_EQ(session.statistics().queued, queued + 1);
  ASSERT_TRUE(watched.states.waitForLines(1));
  EXPECT_THAT(watched.states.lines().front(), StartsWith("connecting: No daemon listens on "));
  EXPECT_EQ(session.close(), queued);
  EXPECT_EQ(watched.states.lines().back(), "closed");
  const veltra::Session impossible{{.root = "/" + std::string(200, 'r'), .connectLater = true}};
  EXPECT_EQ(impossible.error().status, VELTRA_INVALID);
}

TEST(Comeback, NoMoreAfterAFinish) {
  FakeDaemon daemon([](WireEnd& link, const Received& call) {
    answerPlainly(link, call);
    if (call.op() == operation::kFinishSession) link.hangUp();
  });
  Watched watched;
  veltra::Session session{{.root = daemon.root.directory(), .stateChanged = watched.handler()}};
  ASSERT_TRUE(session.finish());
  ASSERT_TRUE(watched.states.waitFor("closed"));
  EXPECT_EQ(session.post(5, 1), VELTRA_NO_DAEMON);
  EXPECT_EQ(session.counter(VELTRA_COUNTER_CONNECTIONS), 1u);
}

// Copies go on after a restart, and there is one end mark, which is the last.
TEST(Comeback, AnAggregatingClientGetsOneEndMark) {
  std::atomic<int> connection{0};
  Journal copies, described;
  FakeDaemon daemon([&](WireEnd& link, const Received& call) {
    if (call.op() != operation::kSetSessionInfo) return;
    described.add(formats::writeJSON(*call.args().find("hasAggregationBlock")));
    if (++connection > 3) return;
    link.send(copyFrame({{"timestamp", 1.5}, {"type", connection.load()}}));
    if (connection < 3) link.send(goodbyeFrame(1));
    link.send(copyFrame({{"timestamp", 0.0}, {"category", 0}, {"type", 0}}));
    link.hangUp();
  });
  const veltra::Session session{{.aggregated =
                                     [&](const veltra::Aggregated& copy) {
                                       copies.add(copy.timestamp == 0 ? "end" : std::to_string(copy.type));
                                     },
                                 .root = daemon.root.directory()}};
  ASSERT_TRUE(described.waitForLines(4));
  EXPECT_THAT(copies.lines(), ElementsAre("1", "2", "3", "end"));
  EXPECT_THAT(described.lines(), ElementsAre("true", "true", "true", "false"));
}

long threadsOfProcess() {
  return std::distance(std::filesystem::directory_iterator("/proc/self/task"), {});
}

TEST(Comeback, AThreadComesWithTheFirstCallThatNeedsIt) {
  FakeDaemon daemon(answerPlainly);
  veltra::Session session = open(daemon);
  const long before = threadsOfProcess();
  EXPECT_EQ(textOf(session.sendAndWait(2, 3, {})), "2/3");
  EXPECT_EQ(threadsOfProcess(), before);
  ASSERT_TRUE(session.start());  // a session that was started comes back by itself
  EXPECT_EQ(threadsOfProcess(), before + 1);
}

// Runs `child` in a forked process; true if it returned true there.
template <typename Child>
bool inFork(Child child) {
  const pid_t process = ::fork();
  if (process == 0) ::_exit(child() ? 0 : 1);
  int status = 0;
  EXPECT_EQ(::waitpid(process, &status, 0), process);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

TEST(Fork, LeavesTheConnectionToTheParent) {
  FakeDaemon daemon([](WireEnd& link, const Received& call) { answerPlainly(link, call); });
  veltra::Session session = open(daemon);
  ASSERT_TRUE(session.start());
  // Another thread uses the session, so that some forks come while it holds the lock or reads.
  std::atomic<bool> stop{false};
  std::atomic<unsigned> sent{0};
  std::thread busy([&] {
    while (!stop) {
      EXPECT_EQ(textOf(session.sendAndWait(2, 3, {})), "2/3");
      ++sent;
    }
  });
  for (int i = 0; i < 50; ++i) {
    EXPECT_TRUE(inFork([&] {
      const bool refused = session.post(1, 1) == VELTRA_FORKED &&
                           session.sendAndWait(1, 1, {}).status == VELTRA_FORKED &&
                           session.statistics().sent == 0 && session.counter(VELTRA_COUNTER_CONNECTIONS) == 0;
      return refused && session.close() == 0 && open(daemon).sendAndWait(7, 7, {});
    })) << i;
  }
  stop = true;
  busy.join();
  EXPECT_GT(sent, 0u);
  EXPECT_EQ(session.counter(VELTRA_COUNTER_CONNECTIONS), 1u);
}

TEST(Fork, InACallbackEndsTheChildWithTheCallback) {
#if __has_feature(thread_sanitizer)
  GTEST_SKIP() << "ThreadSanitizer ends a forked child badly when the thread that forked ends";
#endif
  FakeDaemon daemon([](WireEnd& link, const Received& call) { answerPlainly(link, call); });
  veltra::Session session = open(daemon);
  std::promise<pid_t> forked;
  ASSERT_EQ(session.start([&](const veltra::Reply&) {
    const pid_t process = ::fork();
    if (process != 0) return forked.set_value(process);
#if __has_feature(address_sanitizer)
    // What the threads that the child lacks had allocated is no leak.
    static_cast<void>(std::atexit([] { ::_exit(0); }));
#endif
  }),
            VELTRA_OK);
  int status = 1;
  const pid_t process = forked.get_future().get();
  ASSERT_EQ(::waitpid(process, &status, 0), process);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(textOf(session.sendAndWait(2, 3, {})), "2/3");
}

}  // namespace
}  // namespace veltrad::client_test
