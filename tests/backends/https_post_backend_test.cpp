// The HTTPS post backend at its door: what is posted where, in which form, and what its answers do.
#include <gtest/gtest.h>

#include <cmath>

#include "backends/https/event.h"
#include "backends/https/https_post_backend.h"
#include "base/json.h"
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

std::string header(const platform::HTTPRequest& request, std::string_view name) {
  for (const auto& [key, value] : request.headers) {
    if (key == name) return value;
  }
  return "(none)";
}

TEST_F(HTTPSPost, AnEventCarriesSessionDeviceAndTime) {
  const auto backend = make({entry()});
  EXPECT_EQ(backend->state(), kBackendReporting);
  const Dictionary payload{{"codec", "opus"}, {"_method", "mine"}, {"when", Date{7}}};
  Dictionary event = createEventDictfromPayload(*backend, &payload, kEvent, 5, 1, 9, 3600);
  const Dictionary expected{{"_startTS", 1'000'000'020},
                            {"_sender", "JY"},
                            {"_clientVersion", 3u},
                            {"_sessionID", "own"},
                            {"_eventNumber", 9u},
                            {"_method", 5u},
                            {"_status", 1u},
                            {"_clientTS", 1'000'000'060.35},
                            {"eventTime", 1'000'000'060.35},
                            {"_productFamily", "Desktop"},
                            {"_productModel", "Workbench 3"},
                            {"_osVersion", "12"},
                            {"_build", "12A301"},
                            {"_internal", 3u},
                            {"_reportVers", "8.1"},
                            {"_timezoneOffset", 3600},
                            {"codec", "opus"},
                            {"when", Date{7}}};
  for (const auto& [key, value] : expected) {
    const Value* found = event.find(key);
    ASSERT_NE(found, nullptr) << key;
    if (value.type() == Value::Type::real) {
      EXPECT_NEAR(*found->toDouble(), *value.toDouble(), 1e-5) << key;
    } else {
      EXPECT_EQ(*found, value) << key;
    }
  }
  EXPECT_EQ(event.size(), expected.size());
}

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

TEST_F(HTTPSPost, PostsWithHeadersAndFilters) {
  world.consent();
  Dictionary one = entry();
  one.merge({{"realtime_post_url", "https://c.example/now"},
             {"locale_whitelist", Array{"DE"}},
             {"sampling_threshold", 1},
             {"filters", Array{Dictionary{{"key", "peer"}, {"action", "remove"}}}}});
  const auto backend = make({one}, {{"clientName", "phone"}, {"serviceName", "ringer"}, {"peer", "x"}}, true);
  const Dictionary payload{{"list", Array{1}}, {"nan", std::nan("")}, {"at", Date{7}}};
  log.expectLine(RecordedLog::Level::warning, "Quillfen unable to handle key: list, value: [1]");
  log.expectLine(RecordedLog::Level::warning, "Quillfen unable to handle key: nan, value: null");
  const auto answer = backend->sendMessage(&payload, kEvent, 5, 1, 3);
  ASSERT_TRUE(answer);
  const auto pretty = parseJSON(*answer);
  ASSERT_TRUE(pretty.ok());
  const Dictionary& event = *pretty.value().asDictionary()->array("events")->at(0).asDictionary();
  EXPECT_EQ(event.find("peer"), nullptr);
  EXPECT_EQ(event.find("list"), nullptr);
  EXPECT_EQ(event.find("nan"), nullptr);
  EXPECT_EQ(event.real("at"), 7.0);
  EXPECT_EQ(*event.string("clientName"), "phone");
  EXPECT_EQ(event.int32("SamplingThreshold"), 1);  // type 1 is a stop message
  EXPECT_EQ(event.int32("OverrideSampling"), -1);

  const auto held = world.http.waitForRequest();
  ASSERT_NE(held, nullptr);
  const auto& request = held->request;
  EXPECT_EQ(request.url, "https://c.example/now");
  const std::vector<std::pair<const char*, std::string>> headers{
      {"X-VLT-Client-Name", "phone"},
      {"X-VLT-Service-Name", "ringer"},
      {"X-VLT-Internal-Build", "(none)"},
      {"User-Agent", "Veltra/8.1 (Workbench 3; 12)"},
      {"X-VLT-Client-Version", "3"},
      {"X-VLT-Sender", "JY"},
      {"X-VLT-Event-Map", "5 1"},
      {"Accept", "application/json"},
      {"Content-Type", "application/json"},
      {"Content-Encoding", "gzip"},
      {"Content-Length", std::to_string(request.body.size())}};
  for (const auto& [name, value] : headers) EXPECT_EQ(header(request, name), value) << name;
  EXPECT_EQ(world.counters.value("event field removed: by a filter"), 1u);
  EXPECT_EQ(world.counters.value("event field removed: JSON cannot carry it"), 2u);
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

using Answer = std::pair<std::optional<std::string>, std::optional<ReportingError>>;

Answer flush(
    const std::shared_ptr<VeltraBackend>& backend, const std::function<void()>& meanwhile = [] {}) {
  std::vector<Answer> answers;
  backend->flushMessagesWithCompletion(
      [&answers](const auto& text, const auto& error) { answers.emplace_back(text, error); });
  meanwhile();
  EXPECT_EQ(answers.size(), 1u);
  return answers.empty() ? Answer{} : answers.front();
}

TEST_F(HTTPSPost, ABatchIsPostedWholeByAFlush) {
  world.consent();
  const auto backend = make({entry()}, {{"clientName", "first"}}, false, true);
  EXPECT_EQ(flush(backend).second->description, "Nothing to flush");
  for (int i = 0; i < 3; ++i) {
    EXPECT_EQ(backend->sendMessage(nullptr, kEvent, static_cast<std::uint16_t>(i), 2, 0), std::nullopt);
  }
  backend->setCorrelatedSessionID("root.own");
  backend->setUserInfoDict(std::make_shared<const Dictionary>(Dictionary{{"clientName", "later"}}));
  const Answer answer = flush(backend, [this] {
    EXPECT_EQ(header(world.http.waitForRequest()->request, "X-VLT-Event-Map"), "(none)");
    world.http.answerNext(FakeHTTPClient::response(200));
  });
  ASSERT_TRUE(answer.first);
  EXPECT_EQ(answer.second, std::nullopt);
  const auto envelope = parseJSON(*answer.first);
  const Array& events = *envelope.value().asDictionary()->array("events");
  ASSERT_EQ(events.size(), 3u);
  for (const Value& event : events) {
    EXPECT_EQ(*event.asDictionary()->string("_sessionID"), "root.own");
    EXPECT_EQ(*event.asDictionary()->string("clientName"), "later");
  }
  EXPECT_EQ(flush(backend).second->description, "Nothing to flush");
}

TEST_F(HTTPSPost, AFlushReportsWhatTheServerDid) {
  const auto backend = make({entry()}, {}, false, true);
  backend->sendMessage(nullptr, kEvent, 5, 2, 0);
  const Answer refused = flush(backend, [this] { world.http.answerNext(FakeHTTPClient::response(503)); });
  EXPECT_EQ(refused.second, makeReportingError("backend httppost disabled by server 503 return code", 503));
  const auto noURL = make({Dictionary{{"filters", Array{}}}}, {}, false, true);
  noURL->sendMessage(nullptr, kEvent, 5, 2, 0);
  EXPECT_EQ(flush(noURL).second->description, "postURL is nil");
}

TEST_F(HTTPSPost, TheThresholdFlushesAndARealtimeEventKeepsTheOrder) {
  Dictionary one = entry();
  one.set("event_threshold", 1);
  one.set("realtime_post_url", "https://c.example/now");
  world.consent();
  const auto backend = make({one}, {}, false, true);
  // Counts 0 and 1 are not above the threshold; the third finds 2 > 1.
  EXPECT_FALSE(backend->sendMessage(nullptr, kEvent, 5, 2, 0));
  EXPECT_FALSE(backend->sendMessage(nullptr, kEvent, 5, 2, 0));
  EXPECT_TRUE(backend->sendMessage(nullptr, kEvent, 5, 2, 0));
  EXPECT_EQ(world.http.pending().size(), 1u);
  const auto answer = backend->sendMessage(nullptr, kEvent, 6, 2, 1);
  ASSERT_TRUE(answer);
  EXPECT_TRUE(answer->starts_with("Flushed events:\n{"));
  EXPECT_NE(answer->find("\nStandalone event:\n{"), std::string::npos);
  const auto held = world.http.pending();
  ASSERT_EQ(held.size(), 3u);
  EXPECT_EQ(held[1]->request.url, "https://c.example/events");
  EXPECT_EQ(held[2]->request.url, "https://c.example/now");
}

TEST_F(HTTPSPost, HeldEventsComeWithAnOverrideOrGo) {
  world.consent();
  Dictionary one = entry();
  one.merge({{"locale_whitelist", Array{"DE"}}, {"sampling_threshold", 0.25}, {"event_threshold", 10}});
  const auto held = make({one}, {{"clientName", "a"}}, true, true);
  EXPECT_EQ(held->state(), kBackendHeld);
  held->sendMessage(nullptr, kEvent, 5, 2, 0);
  EXPECT_EQ(flush(held).second->description, "Nothing to flush");  // and the batch is gone
  EXPECT_EQ(world.counters.value("event dropped: flushed while the back end does not report"), 1u);
  held->sendMessage(nullptr, kEvent, 5, 2, 0);
  held->sendMessage(nullptr, kEvent, 5, 2, 2);
  EXPECT_EQ(held->state(), kBackendReporting);
  const Answer both = flush(held, [this] { world.http.answerNext(FakeHTTPClient::response(200)); });
  const auto envelope = parseJSON(*both.first);
  EXPECT_EQ(envelope.value().asDictionary()->array("events")->size(), 2u);

  const auto waiting = make({one}, {}, true, false);
  EXPECT_EQ(waiting->state(), kBackendWaiting);
  waiting->setState(kBackendReporting);
  waiting->sendMessage(nullptr, kEvent, 5, 2, 1);
  EXPECT_EQ(flush(waiting).second->description, "Can not flush: userInfo is required");
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

TEST_F(HTTPSPost, PreferencesReplaceURLsAndIdentifiersPersist) {
  world.preferences.set("httpsPostURL", "https://mine.example/");
  const auto backend = make({entry()});
  backend->sendMessage(nullptr, kEvent, 5, 2, 1);
  ASSERT_NE(world.http.waitForRequest(), nullptr);
  EXPECT_EQ(world.http.waitForRequest()->request.url, "https://mine.example/");

  World other;
  other.consent();
  Dictionary one = entry();
  one.merge({{"locale_whitelist", Array{"DE"}}, {"sampling_threshold", 1}, {"custom_clientId", 0}});
  std::vector<std::string> identifiers;
  for (int i = 0; i < 2; ++i) {
    const auto custom = other.factory.newBackendWithName(kVeltraBackendHTTPPost,
                                                         Dictionary{{"clients", Array{one}}}, "Desktop", 7);
    custom->setRequireUserInfo(true);
    custom->setUserInfoDict(std::make_shared<const Dictionary>(Dictionary{{"clientName", "x"}}));
    custom->updateState();
    const auto answer = custom->sendMessage(nullptr, kEvent, 5, 2, 0);
    ASSERT_TRUE(answer);
    const auto envelope = parseJSON(*answer);
    identifiers.push_back(*envelope.value().asDictionary()->string("clientId"));
  }
  EXPECT_EQ(identifiers[0], identifiers[1]);
  EXPECT_EQ(other.preferences.text(platform::kVeltraPreferenceDomain, "uuid:x:"), identifiers[0]);
}

TEST_F(HTTPSPost, TheFactoryKnowsItsNames) {
  const Value profile = Dictionary{{"clients", Array{}}};
  log.expectLine(RecordedLog::Level::error, "VeltraBackend(newBackendWithName): carrierpigeon");
  log.expectLine(RecordedLog::Level::error, "HTTPSPostBackend(initWithName): can't find the client list.");
  EXPECT_NE(world.factory.newBackendWithName("httppost", profile, "Desktop", 7), nullptr);
  EXPECT_NE(world.factory.newBackendWithName("httppost2", profile, "Desktop", 7), nullptr);
  EXPECT_EQ(world.factory.newBackendWithName("carrierpigeon", profile, "Desktop", 7), nullptr);
  EXPECT_EQ(world.factory.newBackendWithName("httppost", Dictionary{}, "Desktop", 7), nullptr);
  EXPECT_EQ(world.factory.newBackendWithName("httppost", "text", "Desktop", 7), nullptr);
  EXPECT_EQ(world.factory.newBackendWithName("httppost", profile, std::nullopt, 7), nullptr);
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
  FakeRandom random({0.25});
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
