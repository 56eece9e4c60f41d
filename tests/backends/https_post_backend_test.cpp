// The HTTPS post backend at its door: what is posted where, in which form, and what its answers do.
#include <gtest/gtest.h>

#include "backends/https/event.h"
#include "backends/https/https_post_backend.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "protocol/constants.h"

namespace veltrad {
namespace {

constexpr platform::TimeValue kStart{1'000'000'059, 900'000};
constexpr platform::TimeValue kEvent{1'000'000'100, 250'000};

Dictionary entry() {
  return {{"post_url", "https://c.example/events"}, {"filters", Array{}}};
}

class HTTPSPost : public ::testing::Test {
 protected:
  std::shared_ptr<VeltraBackend> make(Array clients, Dictionary userInfo = {}, bool requireUserInfo = false,
                                      bool batch = false, std::int32_t compType = 7) {
    const Dictionary profile{{"clients", std::move(clients)}};
    auto backend = world.factory.newBackendWithName(kVeltraBackendHTTPPost, profile, "Desktop", compType);
    backend->setCompType(compType);
    backend->setSessionID(42);
    backend->setClientVersion(3);
    backend->setUdid("device-id");
    backend->setProductVersion("12");
    backend->setBuildVersion("12A301");
    backend->setHardwareType("Workbench 3");
    backend->setIsInternal(internal);
    backend->setRequireUserInfo(requireUserInfo);
    backend->setBatchEvents(batch);
    if (!userInfo.empty()) backend->setUserInfoDict(std::make_shared<const Dictionary>(std::move(userInfo)));
    backend->setSelfVersion("8.1");
    backend->setStartTimestamp(kStart);
    backend->setCombinedSessionIDString("own");
    backend->updateState();
    return backend;
  }
  RecordedLog log;
  World world;
  bool internal = false;
};

TEST_F(HTTPSPost, InternalBuildsOfThreeTypesReportTheNumber) {
  internal = true;
  const std::vector<std::pair<std::int32_t, bool>> types{
      {7, true}, {11, true}, {13, true}, {12, false}, {17, false}};
  for (const auto& [type, number] : types) {
    const Dictionary event =
        createEventDictfromPayload(*make({entry()}, {}, false, false, type), nullptr, kEvent, 1, 1, 1, 0);
    EXPECT_EQ(*event.find("_sessionID"), number ? Value(42u) : Value("own")) << type;
  }
}

TEST_F(HTTPSPost, WithoutConsentNothingIsAnsweredAndForcedLoggingNeedsTheEnvironment) {
  struct Row {
    bool consent, force;
    int environment;
    bool answered;
  };
  for (const Row& row : {Row{true, false, 4, true}, Row{false, false, 2, false}, Row{false, true, 2, true},
                         Row{false, true, 1, true}, Row{false, true, 4, false}}) {
    World other;
    other.preferences.set("DiagnosticLogSubmissionEnabled", row.consent);
    other.preferences.set("forceEventLogging", row.force ? "  +01" : "no");
    other.preferences.set("environmentType", row.environment);
    const auto backend = other.factory.newBackendWithName(
        kVeltraBackendHTTPPost2, Dictionary{{"clients", Array{entry()}}}, "Desktop", 7);
    backend->updateState();
    EXPECT_EQ(backend->sendMessage(nullptr, kEvent, 5, 2, 0).has_value(), row.answered) << row.environment;
  }
}

TEST_F(HTTPSPost, OnlyA5xxDisables) {
  for (const auto& [status, state] : {std::pair{200, 2}, {302, 2}, {404, 2}, {500, 1}, {599, 1}, {600, 2}}) {
    const auto backend = make({entry()});
    backend->sendMessage(nullptr, kEvent, 5, 2, 0);
    ASSERT_TRUE(world.http.answerNext(FakeHTTPClient::response(status)));
    EXPECT_EQ(backend->state(), state) << status;
  }
  EXPECT_EQ(world.counters.value("event posted"), 1u);
  EXPECT_EQ(world.counters.value("event lost: the server answered 5xx"), 2u);
  const auto backend = make({entry()});
  using Kind = platform::HTTPError::Kind;
  for (const auto& [kind, reason] :
       {std::pair{Kind::transport, "event lost: the post failed"},
        {Kind::tooMany, "event lost: too many posts under way"},
        {Kind::stopping, "event lost: the daemon stopped before the post ended"}}) {
    log.expectLine(RecordedLog::Level::error, "HTTPSPostBackend(postJsonMessage): post error: cut");
    backend->sendMessage(nullptr, kEvent, 5, 2, 0);
    ASSERT_TRUE(world.http.answerNext(FakeHTTPClient::error(kind, "cut")));
    EXPECT_EQ(world.counters.value(reason), 1u) << reason;
  }
  EXPECT_EQ(backend->state(), kBackendReporting);
}

TEST_F(HTTPSPost, AFlushWaitsForUserInfoAndNeedsAURL) {
  const auto problem = [](const std::shared_ptr<VeltraBackend>& backend) {
    std::string answers;  // one
    backend->flushMessagesWithCompletion(
        [&](const auto&, const auto& error) { answers += error ? error->description : "none"; });
    return answers;
  };
  const auto waiting = make({entry()}, {}, true, false);
  EXPECT_EQ(waiting->state(), kBackendWaiting);
  waiting->setState(kBackendReporting);
  waiting->sendMessage(nullptr, kEvent, 5, 2, 1);
  EXPECT_EQ(problem(waiting), "Can not flush: userInfo is required");
  const auto noURL = make({Dictionary{{"filters", Array{}}}}, {}, false, true);
  noURL->sendMessage(nullptr, kEvent, 5, 2, 0);
  EXPECT_EQ(problem(noURL), "postURL is nil");
}

TEST_F(HTTPSPost, ABatchWithoutEndIsBounded) {
  Dictionary one = entry();
  one.merge({{"event_threshold", 1 << 30}, {"locale_whitelist", Array{"DE"}}, {"sampling_threshold", 0.25}});
  world.consent();
  const auto held = make({one}, {{"clientName", "a"}}, true, true);
  for (int i = 0; i < 5000; ++i) held->sendMessage(nullptr, kEvent, 5, 2, 0);
  EXPECT_EQ(world.counters.value("event dropped: the batch is full"), 5000 - EventBatch::kMostEvents);
  EXPECT_TRUE(world.http.pending().empty());
}

TEST_F(HTTPSPost, WhatIsStillBatchedAtTheEndIsCounted) {
  auto backend = make({entry()}, {}, false, true);
  for (std::uint16_t method = 5; method < 8; ++method) backend->sendMessage(nullptr, kEvent, method, 2, 0);
  backend.reset();
  EXPECT_EQ(world.counters.value("event dropped: its back end ended before a flush"), 3u);
}

TEST_F(HTTPSPost, APreferenceReplacesURLs) {
  world.preferences.set("httpsPostURL", "https://mine.example/");
  const auto backend = make({entry()});
  backend->sendMessage(nullptr, kEvent, 5, 2, 1);
  ASSERT_NE(world.http.waitForRequest(), nullptr);
  EXPECT_EQ(world.http.waitForRequest()->request.url, "https://mine.example/");
}

TEST(VeltraBackend, NumbersMessagesAndParsesVersions) {
  struct Counting final : VeltraBackend {
    explicit Counting(platform::Random& random) : VeltraBackend("x", {}, "", random) {}
    using VeltraBackend::sendMessage;
    std::optional<std::string> sendMessage(const Dictionary*, platform::TimeValue, std::uint16_t,
                                           std::uint16_t, std::uint16_t eventID, std::int32_t) override {
      return std::to_string(eventID);
    }
  };
  FakeRandom random;
  const auto backend = std::make_shared<Counting>(random);
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "1");
  for (int i = 2; i < 65'536; ++i) backend->sendMessage(nullptr, {}, 0, 0, 0);
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "0");
  EXPECT_EQ(backend->sendMessage(nullptr, {}, 0, 0, 0), "1");
  for (const auto& [text, major, minor] :
       {std::tuple{"9.3", 9, 3}, {"10", 10, 0}, {"300.1", 44, 1}, {"x.y", 0, 0}, {"8.0.7", 8, 0}}) {
    backend->setSelfVersion(text);
    EXPECT_EQ(backend->selfVersionMajor(), major) << text;
    EXPECT_EQ(backend->selfVersionMinor(), minor) << text;
  }
  EXPECT_EQ(VeltraBackend::convertIntoSHA256("").substr(0, 8), "e3b0c442");
}

}  // namespace
}  // namespace veltrad
