// What the library's tests share: owners of handles, and what callbacks say.
#pragma once

#include <gmock/gmock.h>

#include <chrono>
#include <condition_variable>
#include <future>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "fake_daemon.h"
#include "veltra/veltra.h"

namespace veltrad::test {

struct SessionCloser {
  void operator()(veltra_session* session) const { veltra_session_close(session); }
};
using SessionPointer = std::unique_ptr<veltra_session, SessionCloser>;
struct ReplyReleaser {
  void operator()(veltra_reply* reply) const { veltra_reply_release(reply); }
};
using ReplyPointer = std::unique_ptr<veltra_reply, ReplyReleaser>;

inline veltra_session_options optionsFor(const std::string& root) {
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.root = root.c_str();
  return options;
}

inline SessionPointer open(const veltra_session_options& options) {
  char* error = nullptr;
  veltra_status status = VELTRA_OK;
  SessionPointer session(veltra_session_create(&options, &status, &error));
  EXPECT_TRUE(session) << (error ? error : "no text");
  EXPECT_EQ(status, session ? VELTRA_OK : status);
  veltra_free(error);
  return session;
}

inline SessionPointer open(const FakeDaemon& daemon) {
  return open(optionsFor(daemon.root()));
}

struct Refusal {
  veltra_status status = VELTRA_OK;
  std::string text;
};

inline Refusal refused(const veltra_session_options& options) {
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

inline std::string textOf(const veltra_reply* reply) {
  const char* text = veltra_reply_text(reply, nullptr);
  return text ? text : "(none)";
}

inline std::string describe(const veltra_reply* reply) {
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

}  // namespace veltrad::test
