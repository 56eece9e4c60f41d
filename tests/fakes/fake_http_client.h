// The HTTP client's twin: holds each request until the test answers it, or answers by a function. Any thread.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdlib>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/http_client.h"

namespace veltrad {

// Like the real one, a completion never runs inside start(): it runs on the thread that answers. perform()
// waits until another thread answers. What is left at the end is answered with `stopping`.
class FakeHTTPClient final : public platform::HTTPClient {
 public:
  class Held {
   public:
    const platform::HTTPRequest request;

    Held(platform::HTTPRequest asked, platform::HTTPCompletion completion)
        : request(std::move(asked)), _completion(std::move(completion)) {}
    bool answered() const { return _answered; }

   private:
    friend class FakeHTTPClient;
    platform::HTTPCompletion _completion;
    std::atomic<bool> _answered{false};
  };
  using HeldRequest = std::shared_ptr<Held>;
  using Answerer = std::function<platform::HTTPResult(const platform::HTTPRequest&)>;

  FakeHTTPClient() = default;
  // Answers at once, on a thread of its own.
  explicit FakeHTTPClient(Answerer answerer) { answerAtOnce(std::move(answerer)); }
  ~FakeHTTPClient() override {
    {
      const std::lock_guard lock(_mutex);
      _ending = true;
      _changed.notify_all();
    }
    if (_thread.joinable()) _thread.join();
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
  static platform::HTTPResult transportError(
      std::string description = "Could not resolve host: host.invalid") {
    return error(platform::HTTPError::Kind::transport, std::move(description));
  }

  void start(platform::HTTPRequest request, platform::HTTPCompletion completion) override {
    const std::lock_guard lock(_mutex);
    _held.push_back(std::make_shared<Held>(std::move(request), std::move(completion)));
    ++_asked;
    _changed.notify_all();
  }

  platform::HTTPResult perform(platform::HTTPRequest request) override {
    struct Waiter {
      std::mutex mutex;
      std::condition_variable given;
      std::unique_ptr<platform::HTTPResult> result;
    };
    const auto waiter = std::make_shared<Waiter>();
    start(std::move(request), [waiter](platform::HTTPResult result) {
      const std::lock_guard lock(waiter->mutex);
      waiter->result = std::make_unique<platform::HTTPResult>(std::move(result));
      waiter->given.notify_one();
    });
    std::unique_lock lock(waiter->mutex);
    waiter->given.wait(lock, [&] { return waiter->result != nullptr; });
    return std::move(*waiter->result);
  }

  // From now on; what is held already is answered too. Empty: requests are held again.
  void answerAtOnce(Answerer answerer) {
    const std::lock_guard lock(_mutex);
    _answerer = std::move(answerer);
    if (!_thread.joinable()) _thread = std::thread([this] { answerHeld(); });
    _changed.notify_all();
  }

  // Those not answered yet, the oldest first.
  std::vector<HeldRequest> pending() const {
    const std::lock_guard lock(_mutex);
    return {_held.begin(), _held.end()};
  }
  // All requests so far, answered or not.
  std::size_t asked() const {
    const std::lock_guard lock(_mutex);
    return _asked;
  }

  // The oldest one not answered yet; waits for it, null when none came in time.
  HeldRequest waitForRequest(std::chrono::milliseconds within = std::chrono::seconds(10)) const {
    const std::vector<HeldRequest> held = waitForRequests(1, within);
    return held.empty() ? nullptr : held.front();
  }
  // At least `count` of them not answered yet; fewer when the time was over.
  std::vector<HeldRequest> waitForRequests(
      std::size_t count, std::chrono::milliseconds within = std::chrono::seconds(10)) const {
    std::unique_lock lock(_mutex);
    _changed.wait_for(lock, within, [&] { return _held.size() >= count; });
    return {_held.begin(), _held.end()};
  }

  // Runs the completion here. Answering a second time is a fault of the test.
  void answer(const HeldRequest& held, platform::HTTPResult result) {
    {
      const std::lock_guard lock(_mutex);
      if (held->_answered.exchange(true)) std::abort();
      std::erase(_held, held);
    }
    std::exchange(held->_completion, nullptr)(std::move(result));
  }
  // The oldest one; false when none came in time.
  bool answerNext(platform::HTTPResult result, std::chrono::milliseconds within = std::chrono::seconds(10)) {
    const HeldRequest held = waitForRequest(within);
    if (held) answer(held, std::move(result));
    return held != nullptr;
  }

 private:
  void answerHeld() {
    std::unique_lock lock(_mutex);
    for (;;) {
      _changed.wait(lock, [this] { return _ending || (_answerer && !_held.empty()); });
      if (_ending) return;
      const HeldRequest held = _held.front();
      const Answerer answerer = _answerer;
      lock.unlock();
      answer(held, answerer(held->request));
      lock.lock();
    }
  }

  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::deque<HeldRequest> _held;
  std::size_t _asked = 0;
  Answerer _answerer;
  bool _ending = false;
  std::thread _thread;
};

}  // namespace veltrad
