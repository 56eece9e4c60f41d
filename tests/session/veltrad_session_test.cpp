// One session at its door: configuration, start, routing, flushes, states, the end.
#include "session/veltrad_session.h"

#include <gtest/gtest.h>

#include "fakes/fake_backends.h"
#include "fakes/fake_connection.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "protocol/constants.h"
#include "session/flush_counters.h"
#include "session/session_delegate.h"
#include "support/message_log.h"

namespace veltrad {
namespace {

struct Lines final : MessageLog {
  void writeToLogFile(std::string_view format, std::initializer_list<std::string_view> values) override {
    lines.push_back(filledFormat(format, values));
  }
  std::vector<std::string> lines;
};

struct Delegate final : VeltradSessionDelegate {
  std::shared_ptr<const Dictionary> storebagForSession(const VeltradSession&) override { return storebag; }
  std::optional<std::string> storebagVersionForSession(const VeltradSession&) override { return "1.5"; }
  void changeIdentity(const std::function<void()>& change) override { change(); }
  void userInfoUpdatedForSession(const std::shared_ptr<VeltradSession>&) override { ++userInfoUpdates; }
  std::optional<std::string> parentSessionIDStringForSession(const VeltradSession&) override { return {}; }
  std::shared_ptr<VeltradSession> parentSessionForChild(const VeltradSession&) override { return nullptr; }
  bool withAncestorAggregator(const VeltradSession&, const std::function<void(VeltradSession&)>&) override {
    return false;
  }
  void updateDownstreamSessions(const std::shared_ptr<VeltradSession>&) override { ++downstreamUpdates; }
  std::string description() const override { return "delegate under test"; }
  std::shared_ptr<const Dictionary> storebag;
  int userInfoUpdates = 0;
  int downstreamUpdates = 0;
};

class Session : public ::testing::Test {
 protected:
  void configure(Dictionary info = {{"sessionID", 42}, {"clientType", 7}, {"requireUserInfo", true}},
                 OptionalDictionary userInfo = Dictionary{{"clientName", "phone"}, {"serviceName", "ringer"}},
                 bool aggregates = false) {
    session->setSessionInfo(std::move(info), std::move(userInfo), std::nullopt, aggregates);
  }
  std::optional<std::vector<std::string>> start(Dictionary storebag) {
    delegate.storebag = std::make_shared<const Dictionary>(std::move(storebag));
    return startAgain();
  }
  std::optional<std::vector<std::string>> startAgain() {
    std::optional<std::vector<std::string>> names;
    session->startConfigWithCompletionHandler([&names](auto given) { names = std::move(given); });
    return names;
  }
  std::optional<std::string> send(Dictionary message) {
    std::optional<std::string> reply = "(not called)";
    session->sendMessageWithDictionary(std::move(message), [&reply](auto text) { reply = std::move(text); });
    return reply;
  }
  static Dictionary message(Dictionary more = {}) {
    Dictionary made{{"category", 5}, {"type", 1}, {"payload", Dictionary{{"codec", "opus"}}}};
    made.merge(more);
    return made;
  }

  RecordedLog log;
  World world;
  FakeBackendFactory backends;
  FlushCounters flushes;
  Lines messageLog;
  Delegate delegate;
  std::shared_ptr<FakeConnection> connection = std::make_shared<FakeConnection>();
  std::shared_ptr<VeltradSession> session = VeltradSession::initWithSessionDelegate(
      {backends, world.device, world.library, world.clock, world.preferences, world.locale, world.counters,
       flushes, messageLog},
      delegate, connection);
};

Dictionary profile(const char* answer, std::int32_t state = kBackendReporting) {
  return {{"answer", answer}, {"state", state}};
}

TEST_F(Session, StartsItsBackendsAndSaysWhichReport) {
  configure();
  EXPECT_EQ(session->sessionIDString().size(), 24u);
  const auto names = start({{"dashboard", profile("d", kBackendDisabled)},
                            {"httppost", profile("h")},
                            {"httppost2", profile("2", kBackendHeld)},
                            {"unknown", 1}});
  EXPECT_EQ(names, (std::vector<std::string>{"httppost", "httppost2"}));
  const auto& backend = *backends.last["httppost"];
  EXPECT_EQ(backend.sessionID(), 42u);
  EXPECT_EQ(backend.compType(), 7);
  EXPECT_EQ(backend.combinedSessionIDString(), session->sessionIDString());
  EXPECT_EQ(backend.udid(), "00112233445566778899aabbccddeeff00112233");
  EXPECT_TRUE(backend.requireUserInfo());
  EXPECT_EQ(*backend.userInfoDict()->string("clientName"), "phone");
  EXPECT_EQ(delegate.userInfoUpdates, 1);
  EXPECT_EQ(delegate.downstreamUpdates, 1);
  ASSERT_EQ(backend.messages.size(), 1u);
  EXPECT_EQ(backend.messages[0].method, 0);
  EXPECT_EQ(backend.messages[0].respCode, 0);
  EXPECT_EQ(*backend.messages[0].payload, (Dictionary{{"AutomaticTimeSet", true}, {"Locale", "DE"}}));

  const auto replaced = backends.last["httppost"];
  startAgain();
  EXPECT_TRUE(replaced->cleaned);
  EXPECT_NE(backends.last["httppost"], replaced);
}

TEST_F(Session, WithoutAStorebagEverythingFailsPolitely) {
  configure();
  EXPECT_EQ(startAgain(), std::nullopt);
  EXPECT_EQ(send(message()), std::nullopt);
  std::optional<ReportingError> error;
  session->flushMessagesWithCompletion([&error](auto, auto given) { error = std::move(given); });
  EXPECT_EQ(error, makeReportingError("No backends available to send message", -1));
  EXPECT_EQ(world.counters.value("message dropped: the session has no back ends"), 1u);
  EXPECT_EQ(start({{"unknown", 1}}), std::vector<std::string>{});
  bool called = false;
  session->flushMessagesWithCompletion([&called](auto text, auto given) { called = !text && !given; });
  EXPECT_TRUE(called);
}

TEST_F(Session, ChoosesTheAnswerAndLogsEveryAnswer) {
  configure();
  start({{"ampery", profile("a")}, {"dashboard", profile("d")}, {"httppost", profile("h")}});
  messageLog.lines.clear();
  EXPECT_EQ(send(message({{"flag", 3}})), "h");
  EXPECT_EQ(messageLog.lines, (std::vector<std::string>{"[ampery -> sendMessageWithDictionary] a",
                                                        "[dashboard -> sendMessageWithDictionary] d",
                                                        "[httppost -> sendMessageWithDictionary] h"}));
  EXPECT_EQ(backends.last["ampery"]->messages.back().flag, 3);
  backends.last["httppost"]->answer.reset();
  EXPECT_EQ(send(message()), "d");
  backends.last["dashboard"]->answer.reset();
  EXPECT_EQ(send(message()), std::nullopt);

  using Seen = std::tuple<std::uint16_t, std::uint16_t, bool, std::int32_t>;
  const std::pair<Dictionary, std::optional<Seen>> rows[] = {
      {{{"type", 1}}, {}},
      {{{"category", 1}}, {}},
      {{{"category", "5"}, {"type", 1}}, {}},
      {{{"category", 65'541}, {"type", -1}}, Seen(5, 65'535, false, 0)},
      {{{"category", 5.9}, {"type", true}, {"payload", 3}, {"flag", "x"}}, Seen(5, 1, false, 0)}};
  for (const auto& [message, expected] : rows) {
    auto& seen = backends.last["ampery"]->messages;
    seen.clear();
    send(message);
    ASSERT_EQ(seen.size(), expected ? 1u : 0u);
    for (const auto& one : seen)
      EXPECT_EQ(Seen(one.method, one.respCode, one.payload.has_value(), one.flag), expected);
  }
}

TEST_F(Session, AFlushIsAnsweredOnceAtTheFirstErrorOrTheLastBackend) {
  configure();
  start({{"a", 1}, {"b", 1}, {"c", 1}});
  std::vector<std::pair<std::optional<std::string>, std::optional<ReportingError>>> answers;
  const auto flush = [&] {
    answers.clear();
    session->flushMessagesWithCompletion([&](auto text, auto error) { answers.emplace_back(text, error); });
  };
  flush();
  backends.last["a"]->flush("one", std::nullopt);
  backends.last["b"]->flush(std::nullopt, makeReportingError("no", 503));
  ASSERT_EQ(answers.size(), 1u);
  EXPECT_EQ(answers[0].second, makeReportingError("no", 503));
  backends.last["c"]->flush(std::nullopt, makeReportingError("late", 1));
  EXPECT_EQ(answers.size(), 1u);
  EXPECT_EQ(messageLog.lines.back(), "[a -> flushMessages] one");

  flush();
  for (const char* name : {"a", "b", "c"}) {
    EXPECT_TRUE(answers.empty());
    backends.last[name]->flush(std::string(name), std::nullopt);
  }
  ASSERT_EQ(answers.size(), 1u);
  EXPECT_EQ(answers[0].first, "c");
}

TEST_F(Session, UserInfoChangesIdentityOrNot) {
  configure();
  start({{"httppost", profile("h")}});
  struct Row {
    const char* what;
    OptionalDictionary userInfo;
    int updates;
    std::optional<std::string> extra;  // of what the back end then knows
  };
  const Dictionary same{{"clientName", "phone"}, {"serviceName", "ringer"}, {"extra", "x"}};
  for (const Row& row :
       {Row{"none while required", std::nullopt, 0, std::nullopt}, Row{"the same names", same, 0, "x"},
        Row{"a name missing", Dictionary{{"clientName", "phone"}}, 1, std::nullopt},
        Row{"still missing", Dictionary{{"clientName", "phone"}, {"extra", "y"}}, 1, "y"}}) {
    const int before = delegate.userInfoUpdates;
    session->fetchStatesWithUserInfo(row.userInfo, nullptr);
    EXPECT_EQ(delegate.userInfoUpdates - before, row.updates) << row.what;
    const auto known = backends.last["httppost"]->userInfoDict();
    ASSERT_NE(known, nullptr);
    const std::string* extra = known->string("extra");
    EXPECT_EQ(extra ? std::optional(*extra) : std::nullopt, row.extra) << row.what;
  }
  log.expectLine(RecordedLog::Level::warning,
                 "setSessionInfo: Configure session: user info provided without requiring it");
  configure({{"sessionID", 42}});
  session->fetchStatesWithUserInfo(std::nullopt, nullptr);
  EXPECT_EQ(session->userInfo(), nullptr);
}

TEST_F(Session, TheDisplayURLComesFromTheFirstThatHasOne) {
  configure();
  const auto url = [this] {
    std::optional<std::string> given;
    session->fetchDisplayURL([&given](auto text) { given = std::move(text); });
    return given;
  };
  EXPECT_EQ(url(), "URL not available");
  start({{"dashboard", Dictionary{{"url", "d"}}}, {"httppost", 1}, {"httppost2", Dictionary{{"url", ""}}}});
  EXPECT_EQ(url(), "");
  start({{"dashboard", Dictionary{{"url", "d"}}}, {"ampery", Dictionary{{"url", "a"}}}});
  EXPECT_EQ(url(), "d");
}

TEST_F(Session, TheEndSendsTheStopMessageAndCleansUp) {
  configure();
  start({{"httppost", 1}});
  const auto backend = backends.last["httppost"];
  session->end();
  EXPECT_EQ(backend->messages.back().method, 0);
  EXPECT_EQ(backend->messages.back().respCode, 1);
  EXPECT_EQ(*backend->messages.back().payload, (Dictionary{{"StorebagVersion", "1.5"}}));
  EXPECT_EQ(backend->flushes, 1);
  EXPECT_TRUE(backend->cleaned);
  EXPECT_EQ(connection.use_count(), 1);
  backend->flush("after the end", std::nullopt);
  EXPECT_EQ(messageLog.lines.back(), "[httppost -> flushMessages] after the end");
}

TEST_F(Session, AnInternalReleaseReportsTheWholeDevice) {
  world.properties.set("ReleaseType", "Internal");
  world.properties.remove("SerialNumber");
  world.preferences.setValue("com.florn.timed", "TMAutomaticTimeZoneEnabled", false);
  world.locale.country.reset();
  configure();
  start({{"httppost", 1}});
  EXPECT_EQ(*backends.last["httppost"]->messages[0].payload, (Dictionary{{"SerialNum", "Unknown"},
                                                                         {"Version", "12"},
                                                                         {"Build", "12A301"},
                                                                         {"Hardware", "WB3-B"},
                                                                         {"Product", "Desktop"},
                                                                         {"ReportVers", "8.0"},
                                                                         {"AutomaticTimeSet", false}}));
}

}  // namespace
}  // namespace veltrad
