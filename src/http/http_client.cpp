// HTTPS requests: the callers' side. Any thread.
#include "http/http_client.h"

#include <atomic>
#include <new>
#include <system_error>
#include <thread>

#include "base/mutex.h"
#include "base/text.h"
#include "base/value.h"
#include "http/http_inbox.h"
#include "http/http_worker.h"

namespace veltrad::http {

namespace {

// One perform(): its thread waits here for the HTTP thread.
class Answer {
 public:
  void give(HTTPResult result) {
    const Lock lock(_mutex);
    _result.emplace(std::move(result));
    _given.notifyOne();
  }
  HTTPResult wait() {
    const Lock lock(_mutex);
    while (!_result) _given.wait(_mutex);
    return std::move(*_result);
  }

 private:
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _given;
  std::optional<HTTPResult> _result GUARDED_BY(_mutex);
};

}  // namespace

std::optional<std::string_view> HTTPResponse::header(std::string_view name) const {
  for (const auto& [key, value] : headers) {
    if (equalIgnoringCase(key, name)) return value;
  }
  return std::nullopt;
}

std::size_t keptBytes(const HTTPRequest& request) {
  // The transfer, its place in the queues, and the two copies of each header.
  constexpr std::size_t kTransfer = 1536, kCopies = 2, kHeader = 96;
  std::size_t bytes = kTransfer + 2 * request.url.capacity() + blockBytes(request.body.capacity());
  for (const auto& [name, value] : request.headers) {
    bytes += kHeader + kCopies * (name.capacity() + value.capacity());
  }
  return bytes;
}

struct CurlHTTPClient::Impl {
  explicit Impl(HTTPClientSettings given) : settings(std::move(given)) {}

  // Nothing: it was taken.
  std::optional<HTTPError> file(HTTPRequest request, HTTPCompletion completion, bool blocking) {
    try {
      if (auto error = startThread()) return error;
      HTTPInbox::Transfers one;
      one.push_back(std::make_unique<CurlTransfer>(std::move(request), std::move(completion), blocking,
                                                   std::chrono::steady_clock::now()));
      const HTTPInbox::Added added = inbox.add(one);
      if (added == HTTPInbox::Added::refused)
        return HTTPError{HTTPError::Kind::tooMany, "Too many posts under way"};
      if (added == HTTPInbox::Added::first) worker->wake();
      return std::nullopt;
    } catch (const std::bad_alloc&) {
      return CurlTransfer::outOfMemory();
    }
  }
  // Nothing of libcurl is touched before the first request. What was short is not remembered.
  std::optional<HTTPError> startThread() {
    if (started.load(std::memory_order_acquire)) return std::nullopt;
    const Lock lock(starting);
    if (started.load(std::memory_order_relaxed)) return std::nullopt;
    auto made = HTTPWorker::make(inbox, settings.extraCertificatesPath);
    if (!made) return HTTPError{HTTPError::Kind::shortage, "libcurl has no memory or descriptors to begin"};
    try {
      thread = std::thread([running = made.get()] { running->run(); });
    } catch (const std::system_error& error) {
      return HTTPError{HTTPError::Kind::shortage,
                       std::string("The HTTP thread cannot be started: ") + error.code().message().c_str()};
    }
    worker = std::move(made);
    started.store(true, std::memory_order_release);
    return std::nullopt;
  }
  // False when there is no thread yet.
  bool wake() {
    const bool there = started.load(std::memory_order_acquire);
    if (there) worker->wake();
    return there;
  }

  const HTTPClientSettings settings;
  HTTPInbox inbox;
  Mutex starting LEAF_LOCK{LockRank::leaf};
  std::atomic<bool> started{false};
  std::unique_ptr<HTTPWorker> worker;  // both set once, before `started`
  std::thread thread;
};

CurlHTTPClient::CurlHTTPClient(HTTPClientSettings settings)
    : _impl(std::make_unique<Impl>(std::move(settings))) {}

CurlHTTPClient::~CurlHTTPClient() {
  _impl->inbox.stop(true);
  if (_impl->wake()) _impl->thread.join();
}

std::optional<HTTPError> CurlHTTPClient::start(HTTPRequest request, HTTPCompletion completion) {
  return _impl->file(std::move(request), std::move(completion), false);
}

HTTPResult CurlHTTPClient::perform(HTTPRequest request) {
  if (_impl->inbox.blockingFails()) return Failure{CurlTransfer::stopping()};
  const auto answer =
      std::make_shared<Answer>();  // the giver may still be at its lock when the waiter has gone
  auto refusal = _impl->file(
      std::move(request), [answer](HTTPResult result) { answer->give(std::move(result)); }, true);
  if (refusal) return Failure{std::move(*refusal)};
  return answer->wait();
}

bool CurlHTTPClient::stopping() const {
  return _impl->inbox.blockingFails();
}

void CurlHTTPClient::failBlockingWaits() {
  _impl->inbox.failBlocking();
  _impl->wake();
}

void CurlHTTPClient::drain(std::chrono::steady_clock::time_point deadline) {
  if (_impl->inbox.waitUntilIdle(deadline)) return;
  _impl->inbox.stop(false);
  _impl->wake();
  _impl->inbox.waitUntilIdle(std::chrono::steady_clock::time_point::max());
}

bool CurlHTTPClient::passesEmptyTask(std::chrono::milliseconds within) {
  const auto deadline = std::chrono::steady_clock::now() + within;
  const std::uint64_t task = _impl->inbox.addEmptyTask();
  return !_impl->wake() || _impl->inbox.waitForEmptyTask(task, deadline);
}

std::size_t CurlHTTPClient::underWay() const {
  return _impl->inbox.events();
}

}  // namespace veltrad::http
