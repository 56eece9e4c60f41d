// SPDX-License-Identifier: Apache-2.0
// Passes requests from any thread to the HTTP thread, and runs that thread's loop.
#include "http/http_client.h"

#include <curl/curl.h>
#include <pthread.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <exception>
#include <future>
#include <new>
#include <optional>
#include <system_error>
#include <thread>

#include "base/mutex.h"
#include "http/connections.h"
#include "http/curl_transfer.h"
#include "http/gatekeeper.h"
#include "http/http_queue.h"
#include "platform/log.h"

namespace veltrad::http {

// Runs libcurl's multi interface and all completions on one thread. A lack of memory ends the transfer that
// needs it, not the thread.
struct CurlHTTPClient::Impl {
  using Transfers = HTTPQueue::Transfers;
  using Multi = std::unique_ptr<CURLM, decltype(&curl_multi_cleanup)>;
  using Easy = std::unique_ptr<CURL, decltype(&curl_easy_cleanup)>;
  static constexpr std::size_t kIdleHandles = 8;

  explicit Impl(HTTPClientSettings settings)
      : connections(std::move(settings.extraCertificatesPath)), gate(settings.gate) {
    idleHandles.reserve(kIdleHandles);
  }

  // Any thread

  Result<Done, HTTPError> file(HTTPRequest request, HTTPCompletion completion, bool blocking);
  Result<Done, HTTPError> startThread();
  // False when there is no thread yet.
  bool wake();

  // HTTP thread

  void run();
  void stop(const HTTPQueue::Predicate& matches);
  void endRefused(bool alsoRunning);
  void answerRefusals();
  void refuse(Transfers taken);
  void startNext();
  void startOne(Transfers one);
  std::optional<HTTPError> tryToStart(Transfers& one);
  Transfers takeRunning(Transfers::iterator at);
  void finish();
  void endExpired();
  void end(Transfers one, HTTPResult result);
  void complete(Transfers one, HTTPResult result);
  void record(const std::string& host, const HTTPResult& result);
  void keep(Easy easy);

  HTTPQueue queue;
  Mutex starting LEAF_LOCK{LockRank::leaf};
  // Once it is true, `multi` and `thread` do not change.
  std::atomic<bool> started{false};
  Connections connections;
  const Gatekeeper gate;
  Multi multi{nullptr, curl_multi_cleanup};
  std::thread thread;
  ServerRecords records;

  // HTTP thread only
  std::vector<Easy> idleHandles;  // making one costs more than resetting one
  Transfers running;
};

Result<Done, HTTPError> CurlHTTPClient::Impl::file(HTTPRequest request, HTTPCompletion completion,
                                                   bool blocking) {
  try {
    if (auto running = startThread(); !running) return running;
    Transfers one;
    one.emplace_back(std::move(request), std::move(completion), blocking, std::chrono::steady_clock::now());
    const HTTPQueue::Added added = queue.add(one);
    if (added == HTTPQueue::Added::full)
      return Failure{HTTPError{HTTPError::Kind::tooMany, "Too many posts under way"}};
    if (added == HTTPQueue::Added::first) wake();
    return Done();
  } catch (const std::bad_alloc&) {
    return Failure{CurlTransfer::outOfMemory()};
  }
}

// libcurl is not used before the first request. A failure is not remembered.
Result<Done, HTTPError> CurlHTTPClient::Impl::startThread() {
  if (started.load(std::memory_order_acquire)) return Done();
  const Lock lock(starting);
  if (started.load(std::memory_order_relaxed)) return Done();
  const bool initialised = curl_global_init(CURL_GLOBAL_DEFAULT) == CURLE_OK;
  multi.reset(initialised ? curl_multi_init() : nullptr);
  // Without descriptors it is made nevertheless, but could not be woken.
  if (!multi || curl_multi_wakeup(multi.get()) != CURLM_OK)
    return Failure{HTTPError{HTTPError::Kind::shortage, "libcurl has no memory or descriptors to begin"}};
  curl_multi_setopt(multi.get(), CURLMOPT_PIPELINING, CURLPIPE_NOTHING);
  curl_multi_setopt(multi.get(), CURLMOPT_MAX_HOST_CONNECTIONS, static_cast<long>(HTTPQueue::kConnections));
  curl_multi_setopt(multi.get(), CURLMOPT_MAXCONNECTS, 8L);  // kept alive
  try {
    thread = std::thread([this] { run(); });
  } catch (const std::system_error& error) {
    return Failure{HTTPError{HTTPError::Kind::shortage, std::string("The HTTP thread cannot be started: ") +
                                                            error.code().message().c_str()}};
  }
  started.store(true, std::memory_order_release);
  return Done();
}

bool CurlHTTPClient::Impl::wake() {
  const bool there = started.load(std::memory_order_acquire);
  if (there) curl_multi_wakeup(multi.get());
  return there;
}

void CurlHTTPClient::Impl::run() {
  pthread_setname_np(pthread_self(), "http");
  for (;;) {
    const HTTPQueue::Orders orders = queue.look();
    if (orders.last && running.empty() && queue.empty()) return;
    if (orders.stopping)
      stop([](const CurlTransfer&) { return true; });
    else if (orders.failBlocking)
      stop([](const CurlTransfer& transfer) { return transfer.blocking(); });
    if (orders.askWaiting) endRefused(orders.askRunning);
    answerRefusals();
    int left = 0;
    curl_multi_perform(multi.get(), &left);
    finish();
    endExpired();
    startNext();
    if (orders.last) continue;  // until nothing is left, requests of completions included
    constexpr int kCheckWaiting = 50, kIdle = 3'600'000;  // in ms; libcurl's timers may end the wait earlier
    curl_multi_poll(multi.get(), nullptr, 0, queue.empty() ? kIdle : kCheckWaiting, nullptr);
  }
}

void CurlHTTPClient::Impl::stop(const HTTPQueue::Predicate& matches) {
  for (Transfers taken = queue.take(matches); !taken.empty();)
    complete(HTTPQueue::pop(taken, taken.begin()), Failure{CurlTransfer::stopping()});
  for (auto next = running.begin(); next != running.end();) {
    const auto at = next++;
    if (matches(*at)) end(takeRunning(at), Failure{CurlTransfer::stopping()});
  }
}

// A request that is missed here for lack of memory is refused when it would begin.
void CurlHTTPClient::Impl::endRefused(bool alsoRunning) {
  try {
    refuse(gate.takeRefused(queue));
    for (auto next = running.begin(); alsoRunning && next != running.end();) {
      const auto at = next++;
      if (auto error = gate.refusalOf(*at)) end(takeRunning(at), Failure{std::move(*error)});
    }
  } catch (const std::bad_alloc&) {
  }
}

void CurlHTTPClient::Impl::refuse(Transfers taken) {
  while (!taken.empty()) {
    Transfers one = HTTPQueue::pop(taken, taken.begin());
    HTTPError error = gate.refusedBefore(one.front());
    complete(std::move(one), Failure{std::move(error)});
  }
}

void CurlHTTPClient::Impl::answerRefusals() {
  const auto leaves = [](const CurlTransfer& transfer) {
    return transfer.lane() != HTTPRequest::Lane::storebag;
  };
  for (HTTPQueue::Refusal& order : queue.takeRefusals()) {
    try {
      std::vector<RequestUnderWay> underWay;
      for (const CurlTransfer& transfer : running) {
        if (leaves(transfer)) underWay.push_back(transfer.underWay());
      }
      refuse(order.all ? queue.take(leaves) : gate.takeRefused(queue));
      order.answer.set_value(std::move(underWay));
    } catch (const std::bad_alloc&) {
      order.answer.set_exception(std::current_exception());
    }
  }
}

void CurlHTTPClient::Impl::startNext() {
  try {
    const auto now = std::chrono::steady_clock::now();
    const auto next = [&] { return queue.next(now, gate.hasNoRoom()); };
    for (Transfers one = next(); !one.empty(); one = next()) startOne(std::move(one));
  } catch (const std::bad_alloc&) {
    // The others go on waiting until they time out.
  }
}

void CurlHTTPClient::Impl::startOne(Transfers one) {
  std::optional<HTTPError> error;
  try {
    error = tryToStart(one);
  } catch (const std::bad_alloc&) {
    error = CurlTransfer::outOfMemory();
  }
  if (error) end(std::move(one), Failure{std::move(*error)});
}

// Moves the only element to those that run, or returns why it may not or cannot.
std::optional<HTTPError> CurlHTTPClient::Impl::tryToStart(Transfers& one) {
  if (auto refused = gate.refusalOf(one.front())) return refused;
  if (auto refused = gate.overLimit(one.front())) return refused;
  Easy easy(idleHandles.empty() ? curl_easy_init() : idleHandles.back().release(), curl_easy_cleanup);
  if (!idleHandles.empty()) idleHandles.pop_back();
  const auto now = std::chrono::steady_clock::now();
  if (!easy || !one.front().attach(easy.get(), connections, now) ||
      curl_multi_add_handle(multi.get(), easy.get()) != CURLM_OK)
    return CurlTransfer::outOfMemory();
  static_cast<void>(easy.release());  // owned by the running transfer
  running.splice(running.end(), one);
  return std::nullopt;
}

void CurlHTTPClient::Impl::finish() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(multi.get(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    const CURLcode code = message->data.result;
    const auto found = std::find_if(running.begin(), running.end(), [message](const CurlTransfer& transfer) {
      return transfer.easy() == message->easy_handle;
    });
    HTTPResult result = found->result(code);
    Transfers one = takeRunning(found);
    if (code == CURLE_ABORTED_BY_CALLBACK && one.front().metEndedConnection())
      startOne(std::move(one));
    else
      end(std::move(one), std::move(result));
  }
}

// libcurl times out the transfers that run.
void CurlHTTPClient::Impl::endExpired() {
  const auto now = std::chrono::steady_clock::now();
  Transfers taken = queue.take([now](const CurlTransfer& transfer) { return transfer.expired(now); });
  while (!taken.empty()) {
    Transfers one = HTTPQueue::pop(taken, taken.begin());
    HTTPResult timedOut = one.front().timedOutWaiting();
    complete(std::move(one), std::move(timedOut));
  }
}

CurlHTTPClient::Impl::Transfers CurlHTTPClient::Impl::takeRunning(Transfers::iterator at) {
  curl_multi_remove_handle(multi.get(), at->easy());
  keep(Easy(at->easy(), curl_easy_cleanup));
  return HTTPQueue::pop(running, at);
}

void CurlHTTPClient::Impl::end(Transfers one, HTTPResult result) {
  queue.ended(one.front());
  complete(std::move(one), std::move(result));
}

void CurlHTTPClient::Impl::complete(Transfers one, HTTPResult result) {
  try {
    gate.ended(one.front(), result);
    if (!result) {
      HTTPError error = result.error();
      error.begun = one.front().hasBegun();
      error.transmissions = one.front().transmissions();
      result = Failure{std::move(error)};
    }
    record(one.front().host(), result);
    one.front().complete(std::move(result));
  } catch (const std::bad_alloc&) {
    logError("An answer could not be handled: out of memory");
  }
  one.clear();
  queue.completed();
}

// Requests that failed on this side say nothing about the server.
void CurlHTTPClient::Impl::record(const std::string& host, const HTTPResult& result) {
  const bool own = !result && (result.error().kind == HTTPError::Kind::shortage ||
                               result.error().kind == HTTPError::Kind::stopping ||
                               result.error().kind == HTTPError::Kind::refused);
  if (own) return;
  const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
  records.ended(host, result && result.value().status < 400, now.count());
}

void CurlHTTPClient::Impl::keep(Easy easy) {
  curl_easy_reset(easy.get());
  if (idleHandles.size() < kIdleHandles) idleHandles.push_back(std::move(easy));
}

CurlHTTPClient::CurlHTTPClient(HTTPClientSettings settings)
    : _impl(std::make_unique<Impl>(std::move(settings))) {}

CurlHTTPClient::~CurlHTTPClient() {
  _impl->queue.stop(true);
  if (_impl->wake()) _impl->thread.join();
}

Result<Done, HTTPError> CurlHTTPClient::start(HTTPRequest request, HTTPCompletion completion) {
  return _impl->file(std::move(request), std::move(completion), false);
}

HTTPResult CurlHTTPClient::perform(HTTPRequest request) {
  if (stopping()) return Failure{CurlTransfer::stopping()};
  // Shared, because the completion may still use it when the waiting thread returns.
  const auto answer = std::make_shared<std::promise<HTTPResult>>();
  std::future<HTTPResult> given = answer->get_future();
  const auto taken = _impl->file(
      std::move(request), [answer](HTTPResult result) { answer->set_value(std::move(result)); }, true);
  if (!taken) return Failure{taken.error()};
  return given.get();
}

bool CurlHTTPClient::stopping() const {
  return _impl->queue.blockingFails();
}

void CurlHTTPClient::endRefused(bool running) {
  _impl->queue.endRefused(running);
  _impl->wake();
}

std::optional<std::vector<RequestUnderWay>> CurlHTTPClient::refuseWaiting(bool all,
                                                                          std::chrono::milliseconds within) {
  if (!_impl->started.load(std::memory_order_acquire)) return std::vector<RequestUnderWay>();
  auto answer = _impl->queue.refuseWaiting(all);
  _impl->wake();
  if (answer.wait_for(within) != std::future_status::ready) return std::nullopt;
  return answer.get();
}

void CurlHTTPClient::failBlockingWaits() {
  _impl->queue.failBlocking();
  _impl->wake();
}

void CurlHTTPClient::drain(std::chrono::steady_clock::time_point deadline) {
  if (_impl->queue.waitUntilIdle(deadline)) return;
  _impl->queue.stop(false);
  _impl->wake();
  _impl->queue.waitUntilIdle(std::chrono::steady_clock::time_point::max());
}

bool CurlHTTPClient::passesEmptyTask(std::chrono::milliseconds within) {
  const auto deadline = std::chrono::steady_clock::now() + within;
  const std::future<void> passed = _impl->queue.addEmptyTask();
  return !_impl->wake() || passed.wait_until(deadline) == std::future_status::ready;
}

std::vector<ServerRecord> CurlHTTPClient::servers() const {
  return _impl->records.all();
}

std::size_t CurlHTTPClient::underWay() const {
  return _impl->queue.events();
}

std::string transportLibraries() {
  return curl_version();
}

}  // namespace veltrad::http
