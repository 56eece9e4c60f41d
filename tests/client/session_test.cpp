// Sessions against a scripted daemon: calls out, answers, refusals, the end of a connection.
#include <gmock/gmock.h>

#include <condition_variable>
#include <cstdio>
#include <future>

#include "fake_daemon.h"
#include "veltra/veltra.h"

namespace veltrad::test {
namespace {

struct SessionCloser {
  void operator()(veltra_session* session) const { veltra_session_close(session); }
};
using SessionPointer = std::unique_ptr<veltra_session, SessionCloser>;
struct ReplyReleaser {
  void operator()(veltra_reply* reply) const { veltra_reply_release(reply); }
};
using ReplyPointer = std::unique_ptr<veltra_reply, ReplyReleaser>;

veltra_session_options optionsFor(const std::string& root) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.root = root.c_str();
  return options;
}

SessionPointer open(const veltra_session_options& options) {
  char* error = nullptr;
  veltra_status status = VELTRA_OK;
  SessionPointer session(veltra_session_create(&options, &status, &error));
  EXPECT_TRUE(session) << (error ? error : "no text");
  EXPECT_EQ(status, session ? VELTRA_OK : status);
  veltra_free(error);
  return session;
}

[[maybe_unused]] SessionPointer open(const FakeDaemon& daemon) {
  return open(optionsFor(daemon.root()));
}

struct Refusal {
  veltra_status status = VELTRA_OK;
  std::string text;
};

[[maybe_unused]] Refusal refused(const veltra_session_options& options) {
  char* error = nullptr;
  Refusal refusal;
  veltra_session* session = veltra_session_create(&options, &refusal.status, &error);
  EXPECT_EQ(session, nullptr);
  veltra_session_close(session);
  if (error) refusal.text = error;
  veltra_free(error);
  return refusal;
}

template <typename Wait>
ReplyPointer waited(veltra_status expected, Wait wait) {
  veltra_reply* reply = nullptr;
  EXPECT_EQ(wait(&reply), expected);
  EXPECT_NE(reply, nullptr);
  EXPECT_EQ(veltra_reply_status(reply), expected);
  return ReplyPointer(reply);
}

std::string textOf(const veltra_reply* reply) {
  const char* text = veltra_reply_text(reply, nullptr);
  return text ? text : "(none)";
}

std::string describe(const veltra_reply* reply) {
  const char* text = veltra_reply_error_description(reply);
  return text ? text : "(none)";
}

// Collects what callbacks say; waits for a number of them.
class Collected {
 public:
  static void callback(void* context, const veltra_reply* reply) {
    static_cast<Collected*>(context)->add(veltra_reply_status(reply) == VELTRA_OK ? textOf(reply)
                                                                                  : describe(reply));
  }
  void add(std::string text) {
    const std::lock_guard held(_mutex);
    _texts.push_back(std::move(text));
    _more.notify_all();
  }
  std::vector<std::string> waitFor(std::size_t count) {
    std::unique_lock held(_mutex);
    EXPECT_TRUE(_more.wait_for(held, std::chrono::seconds(20), [&] { return _texts.size() >= count; }));
    return _texts;
  }

 private:
  std::mutex _mutex;
  std::condition_variable _more;
  std::vector<std::string> _texts;
};

// A door that a script waits at.
class Gate {
 public:
  void open() { _opened.set_value(); }
  void wait() { EXPECT_EQ(_future.wait_for(std::chrono::seconds(20)), std::future_status::ready); }

 private:
  std::promise<void> _opened;
  std::shared_future<void> _future = _opened.get_future().share();
};

TEST(Session, DescribesItselfThenStartsSendsAndFinishes) {
  std::mutex mutex;
  std::vector<ReceivedCall> calls;
  FakeDaemon daemon(answering([&](Link& link, const ReceivedCall& call) {
    {
      const std::lock_guard held(mutex);
      calls.push_back(call);
    }
    answerPlainly(link, call);
  }));
  {
    auto options = optionsFor(daemon.root());
    options.has_client_type = options.has_session_id = true;
    options.client_type = -3;
    options.session_id = 4'000'000'000u;
    options.batch_events = true;
    options.client_name = "pho\xffne";
    veltra_value* info = veltra_dictionary();
    veltra_dictionary_set(info, "build", veltra_signed(7));
    options.user_info = info;
    const SessionPointer session = open(options);
    veltra_release(info);

    auto reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_start_wait(session.get(), r); });
    const veltra_value* backends = veltra_reply_backends(reply.get());
    ASSERT_EQ(veltra_count(backends), 2u);
    EXPECT_STREQ(veltra_get_string(veltra_array_item(backends, 1), nullptr), "httppost");
    veltra_value* payload = veltra_dictionary();
    veltra_dictionary_set(payload, "codec", veltra_string("opus"));
    reply = waited(VELTRA_OK,
                   [&](auto r) { return veltra_session_send_wait(session.get(), 5, 65535, payload, 0, r); });
    EXPECT_EQ(textOf(reply.get()), "5/65535");
    EXPECT_EQ(veltra_session_send(session.get(), 1, 2, payload, 3, nullptr, nullptr), VELTRA_OK);
    veltra_release(payload);
    reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_display_url_wait(session.get(), r); });
    EXPECT_EQ(textOf(reply.get()), "URL not available");
    waited(VELTRA_OK, [&](auto r) { return veltra_session_finish_wait(session.get(), r); });
  }
  const std::lock_guard held(mutex);
  ASSERT_EQ(calls.size(), 6u);
  EXPECT_EQ(calls[0].op, "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:");
  EXPECT_EQ(calls[0].id, 0u);
  EXPECT_EQ(calls[0].args,
            (Dictionary{{"sessionInfo", Dictionary{{"batchEvent", true},
                                                   {"clientType", -3},
                                                   {"requireUserInfo", false},
                                                   {"sessionID", 4'000'000'000u}}},
                        {"userInfo", Dictionary{{"build", 7}, {"clientName", "pho\xEF\xBF\xBDne"}}},
                        {"hasAggregationBlock", false}}));
  EXPECT_EQ(calls[2].args,
            (Dictionary{{"category", 5}, {"type", 65535}, {"payload", Dictionary{{"codec", "opus"}}}}));
  EXPECT_EQ(calls[3].op, "sendMessageWithDictionary:reply:");
  EXPECT_EQ(calls[3].id, 0u);
  EXPECT_EQ(calls[3].args, (Dictionary{{"message", Dictionary{{"category", 1},
                                                              {"flag", 3},
                                                              {"payload", Dictionary{{"codec", "opus"}}},
                                                              {"type", 2}}}}));
  EXPECT_EQ(calls[5].op, "finishSessionWithReply:");
}

}  // namespace
}  // namespace veltrad::test
