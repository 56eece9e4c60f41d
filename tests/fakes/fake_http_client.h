// The HTTP client's twin: holds each request until the test answers it, or answers by a function. Any thread.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <functional>
#include <future>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/http_client.h"

namespace veltrad {

// Like the real one, a completion never runs inside start(): it runs on the thread that answers. perform()
// waits until another thread answers, unless there is a function. What is left at the end is answered with
// `stopping`.
class FakeHTTPClient final : public platform::HTTPClient {
 public:
  struct Held {
    platform::HTTPRequest request;
    platform::HTTPCompletion completion;  // run by answer() alone
  };
  using HeldRequest = std::shared_ptr<Held>;
  using Answerer = std::function<platform::HTTPResult(const platform::HTTPRequest&)>;

  FakeHTTPClient() = default;
  // Answers what perform() asks, on its thread.
  explicit FakeHTTPClient(Answerer answerer) : _answerer(std::move(answerer)) {}
  ~FakeHTTPClient() override {
    for (const HeldRequest& held : pending()) answer(held, error(platform::HTTPError::Kind::stopping));
  }

  static platform::HTTPResult response(int status, std::string body = {},
                                       platform::HTTPHeaders headers = {}) {
    return platform::HTTPResponse{status, std::move(headers), std::move(body)};
  }
  static platform::HTTPResult error(platform::HTTPError::Kind kind,
                                    std::string description = "The daemon is stopping") {
    return Failure{platform::HTTPError{kind, std::move(description)}};
  }

  void start(platform::HTTPRequest request, platform::HTTPCompletion completion) override {
    const std::lock_guard lock(_mutex);
    _held.push_back(std::make_shared<Held>(Held{std::move(request), std::move(completion)}));
    _changed.notify_all();
  }

  platform::HTTPResult perform(platform::HTTPRequest request) override {
    if (_answerer) return _answerer(request);
    const auto given = std::make_shared<std::promise<platform::HTTPResult>>();
    start(std::move(request), [given](platform::HTTPResult result) { given->set_value(std::move(result)); });
    return given->get_future().get();
  }

  // Those not answered yet, the oldest first.
  std::vector<HeldRequest> pending() const {
    const std::lock_guard lock(_mutex);
    return _held;
  }

  // The oldest one not answered yet; waits for it, null when none came in time.
  HeldRequest waitForRequest() const {
    std::unique_lock lock(_mutex);
    const bool came = _changed.wait_for(lock, std::chrono::seconds(10), [&] { return !_held.empty(); });
    return came ? _held.front() : nullptr;
  }
  // Runs the completion here. Answering a second time is a fault of the test.
  void answer(const HeldRequest& held, platform::HTTPResult result) {
    {
      const std::lock_guard lock(_mutex);
      if (std::erase(_held, held) != 1) std::abort();
    }
    std::exchange(held->completion, nullptr)(std::move(result));
  }
  // The oldest one; false when none came in time.
  bool answerNext(platform::HTTPResult result) {
    const HeldRequest held = waitForRequest();
    if (held) answer(held, std::move(result));
    return held != nullptr;
  }

 private:
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::vector<HeldRequest> _held;
  const Answerer _answerer;
};

}  // namespace veltrad
