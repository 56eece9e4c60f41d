// The registry: who is let in, when the transaction is open, what the storebag cache downloads.
#include "daemon/veltrad_agent.h"

#include <gtest/gtest.h>

#include <thread>

#include "config/storebag_source.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "platform/transaction.h"
#include "protocol/connection.h"
#include "session/flush_counters.h"
#include "support/message_log.h"

namespace veltrad {

namespace {

// A connection without a socket: the test asks and ends it.
struct FakeConnection final : Connection {
  std::shared_ptr<platform::MemoryAccount> memoryAccount() const override { return nullptr; }
  std::string description() const override { return "connection under test"; }
  std::optional<Value> valueForEntitlement(std::string_view) override { return true; }
  void setExportedObject(std::shared_ptr<ClientSessionInterface> object) override {
    session = std::move(object);
  }
  void setInterruptionHandler(std::function<void()> handler) override { interruption = std::move(handler); }
  void setInvalidationHandler(std::function<void()> handler) override { _invalidation = std::move(handler); }
  void resume() override {}
  std::shared_ptr<ClientSessionReplyInterface> remoteObjectProxyWithErrorHandler(
      std::function<void(const std::string&)>) override {
    return nullptr;  // asked by sessions with an aggregator alone
  }
  // As the connection's own thread does it at the end.
  void invalidate() {
    std::exchange(_invalidation, nullptr)();
    std::exchange(session, nullptr)->end();
  }

  std::shared_ptr<ClientSessionInterface> session;
  std::function<void()> interruption;

 private:
  std::function<void()> _invalidation;
};

// Counts; an open or close out of turn fails the test.
struct FakeTransaction final : platform::Transaction {
  void open() override {
    EXPECT_FALSE(std::exchange(isOpen, true));
    ++opened;
  }
  void close() override { EXPECT_TRUE(std::exchange(isOpen, false)); }
  bool isOpen = false;
  int opened = 0;
};

struct Silent final : MessageLog {
  void writeToLogFile(std::string_view, std::initializer_list<std::string_view>) override {}
};

// Answers as the test says; may be told to hold an exchange until it is let go.
struct Source final : StorebagSource {
  std::optional<Dictionary> fetchStorebagForEnvironmentAndClientType(std::int32_t, std::int32_t& maxAge,
                                                                     std::optional<std::string>& version,
                                                                     bool& notModified,
                                                                     std::optional<std::string>* lastModified,
                                                                     bool& attempted) override {
    attempted = attempts;
    std::unique_lock held(mutex);
    ++fetches;
    changed.notify_all();
    changed.wait(held, [this] { return !hold; });
    conditional = *lastModified;
    maxAge = age;
    notModified = answersNotModified;
    if (section) version = "v" + std::to_string(fetches);
    if (!newLastModified.empty()) *lastModified = newLastModified;
    return section;
  }
  void waitForFetches(int count) {
    std::unique_lock held(mutex);
    ASSERT_TRUE(changed.wait_for(held, std::chrono::seconds(10), [&] { return fetches >= count; }));
  }
  void letGo() {
    const std::lock_guard held(mutex);
    hold = false;
    changed.notify_all();
  }

  std::mutex mutex;
  std::condition_variable changed;
  std::optional<Dictionary> section = Dictionary{};
  std::optional<std::string> conditional;
  std::string newLastModified;
  std::int32_t age = 3600;
  bool answersNotModified = false;
  bool attempts = true;
  bool hold = false;
  int fetches = 0;
};

class Agent : public ::testing::Test {
 protected:
  // A connection and its session hold each other until the end.
  void TearDown() override {
    for (const auto& connection : connections) {
      if (connection->session) connection->invalidate();
    }
    EXPECT_EQ(agent.sessionCount(), 0u);
  }
  std::shared_ptr<FakeConnection> connect() {
    auto connection = connections.emplace_back(std::make_shared<FakeConnection>());
    EXPECT_TRUE(agent.listener(door, connection));
    return connection;
  }
  static VeltradSession& sessionOf(const std::shared_ptr<FakeConnection>& connection) {
    return dynamic_cast<VeltradSession&>(*connection->session);
  }
  std::shared_ptr<FakeConnection> connect(std::int32_t clientType) {
    auto connection = connect();
    connection->session->setSessionInfo(Dictionary{{"clientType", clientType}, {"requireUserInfo", true}},
                                        Dictionary{{"clientName", "Alpha"}, {"serviceName", "BETA"}},
                                        std::nullopt, false);
    return connection;
  }
  std::shared_ptr<const Dictionary> ask(const std::shared_ptr<FakeConnection>& connection) {
    return agent.storebagForSession(sessionOf(connection));
  }

  RecordedLog log;
  World world;
  FlushCounters flushes;
  Silent messageLog;
  Source source;
  std::vector<std::shared_ptr<FakeConnection>> connections;
  FakeTransaction transaction;
  // The agent never looks at it, so there is none behind the reference.
  alignas(16) char nobody[16] = {};
  Listener& door = reinterpret_cast<Listener&>(nobody);
  VeltradAgent agent{{world.factory, world.device, world.library, world.clock, world.preferences,
                      world.locale, world.counters, flushes, messageLog},
                     source,
                     transaction};
};

TEST_F(Agent, TheTransactionIsOpenWhileAnySessionLives) {
  const auto first = connect();
  EXPECT_EQ(log.count(RecordedLog::Level::debug, "as it has proper entitlement, 0(0) connections."), 1);
  const auto second = connect();
  first->interruption();
  EXPECT_EQ(agent.sessionCount(), 2u);
  EXPECT_EQ(transaction.opened, 1);
  first->invalidate();
  EXPECT_TRUE(transaction.isOpen);
  second->invalidate();
  EXPECT_FALSE(transaction.isOpen);
  connect()->invalidate();
  EXPECT_EQ(transaction.opened, 2);
}

TEST_F(Agent, AnEmptiedListStaysAndALeavingSessionIsForgotten) {
  const auto connection = connect(7);
  std::weak_ptr<ClientSessionInterface> session = connection->session;
  connection->session->startConfigWithCompletionHandler(nullptr);
  EXPECT_EQ(agent.userInfoKeyCount(), 1u);
  connection->session->fetchStatesWithUserInfo(Dictionary{{"clientName", "Gamma"}}, nullptr);
  EXPECT_EQ(agent.userInfoKeyCount(), 2u);
  // Its user info goes, its place in the list must go all the same when it ends.
  log.expectLine(RecordedLog::Level::warning, "user info provided without requiring it");
  connection->session->setSessionInfo(std::nullopt, Dictionary{}, std::nullopt, false);
  connection->invalidate();
  EXPECT_TRUE(session.expired());
  EXPECT_EQ(agent.userInfoKeyCount(), 2u);
}

// Nothing is recorded, so the next session asks again at once.
TEST_F(Agent, ADownloadThatWasNoAttemptLeavesTheRecordAsItWas) {
  const auto client = connect(7);
  source.attempts = false;
  const Dictionary standsIn{{"mivo", Dictionary{}}};
  source.section = std::nullopt;
  EXPECT_EQ(ask(client), nullptr);
  source.section = standsIn;
  EXPECT_EQ(*ask(client), standsIn);
  EXPECT_EQ(agent.storebagVersionForSession(sessionOf(client)), std::nullopt);
  source.attempts = true;
  const Dictionary kept{{"httppost", Dictionary{}}};
  source.section = kept;
  source.age = 100;
  EXPECT_EQ(*ask(client), kept);
  EXPECT_EQ(source.fetches, 3);
  world.clock.advance(101);
  source.attempts = false;
  source.newLastModified = "later";
  for (const auto& section : {std::optional(standsIn), std::optional<Dictionary>()}) {
    source.section = section;
    EXPECT_EQ(*ask(client), kept);
  }
  source.attempts = true;
  source.answersNotModified = true;
  EXPECT_EQ(*ask(client), kept);
  EXPECT_EQ(source.fetches, 6);
  EXPECT_EQ(source.conditional, std::nullopt);
}

TEST_F(Agent, ASessionWithoutUserInfoSaysSoAtItsFirstMessageAndAfterAChange) {
  const auto session = connect()->session;
  const auto lines = [&](int count) {
    EXPECT_EQ(log.count(RecordedLog::Level::info, "getAncestorWithAggregatorForSession: No user info found"),
              count);
  };
  session->setSessionInfo(Dictionary{{"clientType", 7}}, std::nullopt, std::nullopt, false);
  lines(0);
  session->startConfigWithCompletionHandler(nullptr);  // the start message is the first
  lines(1);
  session->sendMessageWithCategory(1, 1, std::nullopt, nullptr);
  lines(1);
  session->fetchStatesWithUserInfo(Dictionary{{"clientName", "Gamma"}}, nullptr);
  session->sendMessageWithCategory(1, 1, std::nullopt, nullptr);
  lines(1);
  session->fetchStatesWithUserInfo(std::nullopt, nullptr);
  session->sendMessageWithCategory(1, 1, std::nullopt, nullptr);
  lines(2);
}

TEST_F(Agent, TypesThatShareAStorebagShareOneDownload) {
  const auto first = connect(7);
  const auto second = connect(13);
  EXPECT_NE(ask(first), nullptr);
  EXPECT_EQ(ask(second), ask(first));
  EXPECT_EQ(source.fetches, 1);
  EXPECT_EQ(agent.storebagVersionForSession(sessionOf(second)), "v1");
  world.clock.advance(3599);
  ask(first);
  EXPECT_EQ(source.fetches, 1);
  world.clock.advance(1);
  ask(first);
  EXPECT_EQ(source.fetches, 2);
  world.clock.advance(-86'400);
  ask(first);
  EXPECT_EQ(source.fetches, 3);
}

TEST_F(Agent, AFailureIsRetriedAfter900SecondsAndKeepsWhatWasThere) {
  const auto connection = connect(7);
  source.age = 0;
  source.newLastModified = "Monday";
  const auto section = ask(connection);
  log.expectLine(RecordedLog::Level::error,
                 "fetchAndCacheStorebag: Unable to fetch storebag for client type 7");
  source.section.reset();
  EXPECT_EQ(ask(connection), section);
  EXPECT_EQ(source.conditional, "Monday");
  world.clock.advance(899);
  EXPECT_EQ(ask(connection), section);
  EXPECT_EQ(source.fetches, 2);
  EXPECT_EQ(log.count(RecordedLog::Level::info,
                      "storebagForSession: Not fetching storebag for client type 7 - must wait 900 seconds "
                      "between attempts"),
            1);
  world.clock.advance(1);
  source.answersNotModified = true;
  source.age = 60;
  EXPECT_EQ(ask(connection), section);
  EXPECT_EQ(source.fetches, 3);
  world.clock.advance(59);
  EXPECT_EQ(ask(connection), section);
  EXPECT_EQ(source.fetches, 3);
}

TEST_F(Agent, ATypeWithoutAStorebagLeavesNoRecord) {
  source.section.reset();
  const auto connection = connect(2);
  EXPECT_EQ(ask(connection), nullptr);
  EXPECT_EQ(ask(connection), nullptr);
  EXPECT_EQ(source.fetches, 2);
  EXPECT_EQ(agent.storebagVersionForSession(sessionOf(connection)), std::nullopt);
}

TEST_F(Agent, OthersGoOnDuringADownloadAndTheSameNameWaits) {
  const auto slow = connect(7);
  const auto same = connect(11);
  const auto other = connect(6);
  source.hold = true;
  std::shared_ptr<const Dictionary> first, second;
  std::thread fetching([&] { first = ask(slow); });
  source.waitForFetches(1);
  std::thread waiting([&] { second = ask(same); });
  // The agent's lock is free: a session comes, joins its list and goes.
  agent.userInfoUpdatedForSession(std::dynamic_pointer_cast<VeltradSession>(other->session));
  other->invalidate();
  EXPECT_EQ(agent.userInfoKeyCount(), 1u);
  source.letGo();
  fetching.join();
  waiting.join();
  EXPECT_EQ(source.fetches, 1);
  EXPECT_NE(first, nullptr);
  EXPECT_EQ(first, second);
}

}  // namespace
}  // namespace veltrad
