// The HTTP thread's loop.
#include "http/http_worker.h"

#include <pthread.h>

#include <new>
#include <utility>

#include "platform/log.h"

namespace veltrad::http {

std::unique_ptr<HTTPWorker> HTTPWorker::make(HTTPInbox& inbox, std::string extraCertificatesPath) {
  if (curl_global_init(CURL_GLOBAL_DEFAULT) != CURLE_OK) return nullptr;
  Multi multi(curl_multi_init(), curl_multi_cleanup);
  // Without descriptors it is made all the same, but nobody could wake it.
  if (!multi || curl_multi_wakeup(multi.get()) != CURLM_OK) return nullptr;
  curl_multi_setopt(multi.get(), CURLMOPT_PIPELINING, CURLPIPE_NOTHING);
  curl_multi_setopt(multi.get(), CURLMOPT_MAX_HOST_CONNECTIONS, static_cast<long>(HTTPWaiting::kConnections));
  curl_multi_setopt(multi.get(), CURLMOPT_MAXCONNECTS, 8L);  // kept alive
  return std::unique_ptr<HTTPWorker>(
      new HTTPWorker(inbox, std::move(multi), std::move(extraCertificatesPath)));
}

HTTPWorker::HTTPWorker(HTTPInbox& inbox, Multi multi, std::string extraCertificatesPath)
    : _inbox(inbox), _trust(std::move(extraCertificatesPath)), _multi(std::move(multi)) {
  _idleHandles.reserve(kIdleHandles);
}

HTTPWorker::~HTTPWorker() {
  for (CURL* easy : _idleHandles) curl_easy_cleanup(easy);
}

void HTTPWorker::run() {
  pthread_setname_np(pthread_self(), "http");
  for (;;) {
    HTTPInbox::Taken taken = _inbox.take();
    if (taken.last && taken.transfers.empty() && _running.empty() && _waiting.empty()) return;
    arrive(std::move(taken.transfers));
    if (taken.stopping)
      end([](const CurlTransfer&) { return true; });
    else if (taken.failBlocking)
      end([](const CurlTransfer& transfer) { return transfer.blocking(); });
    int running = 0;
    curl_multi_perform(_multi.get(), &running);
    finish();
    endExpired();
    startNext();
    if (!taken.last) poll();  // else it goes round until nothing is left, completions' own requests included
  }
}

void HTTPWorker::arrive(HTTPInbox::Transfers transfers) {
  while (!transfers.empty()) {
    try {
      _waiting.add(transfers);
    } catch (const std::bad_alloc&) {
      Transfer transfer = std::move(transfers.front());
      transfers.pop_front();
      complete(std::move(transfer), Failure{CurlTransfer::outOfMemory()});
    }
  }
}

void HTTPWorker::end(const HTTPWaiting::Predicate& matches) {
  for (Transfer& transfer : _waiting.take(matches))
    complete(std::move(transfer), Failure{CurlTransfer::stopping()});
  for (auto at = _running.begin(); at != _running.end();) {
    if (!matches(*at->second)) {
      ++at;
      continue;
    }
    Transfer transfer = std::move(at->second);
    curl_multi_remove_handle(_multi.get(), at->first);
    keepHandle(at->first);
    at = _running.erase(at);
    _waiting.ended(*transfer);
    complete(std::move(transfer), Failure{CurlTransfer::stopping()});
  }
}

void HTTPWorker::startNext() {
  try {
    const auto now = std::chrono::steady_clock::now();
    while (Transfer transfer = _waiting.next(now)) startOne(std::move(transfer));
  } catch (const std::bad_alloc&) {
    // They go on waiting, at most until their time is over.
  }
}

void HTTPWorker::startOne(Transfer transfer) {
  const bool idle = !_idleHandles.empty();
  CURL* easy = idle ? _idleHandles.back() : curl_easy_init();
  if (idle) _idleHandles.pop_back();
  if (easy != nullptr) {
    if (runs(easy, transfer)) return;
    keepHandle(easy);
  }
  _waiting.ended(*transfer);
  complete(std::move(transfer), Failure{CurlTransfer::outOfMemory()});
}

// False: there is no memory for it, and nothing has changed.
bool HTTPWorker::runs(CURL* easy, Transfer& transfer) {
  try {
    if (!transfer->attach(easy, _trust, _connections, std::chrono::steady_clock::now())) return false;
    Transfer& place = _running[easy];
    if (curl_multi_add_handle(_multi.get(), easy) == CURLM_OK) {
      place = std::move(transfer);
      return true;
    }
    _running.erase(easy);
  } catch (const std::bad_alloc&) {
  }
  return false;
}

void HTTPWorker::finish() {
  int left = 0;
  while (const CURLMsg* message = curl_multi_info_read(_multi.get(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    CURL* easy = message->easy_handle;
    const CURLcode code = message->data.result;
    const auto found = _running.find(easy);
    Transfer transfer = std::move(found->second);
    _running.erase(found);
    HTTPResult result = transfer->result(code, easy);
    curl_multi_remove_handle(_multi.get(), easy);
    keepHandle(easy);
    if (code == CURLE_ABORTED_BY_CALLBACK && transfer->metEndedConnection()) {
      startOne(std::move(transfer));
      continue;
    }
    _waiting.ended(*transfer);
    complete(std::move(transfer), std::move(result));
  }
}

// Those that run are timed by libcurl.
void HTTPWorker::endExpired() {
  if (_waiting.empty()) return;
  const auto now = std::chrono::steady_clock::now();
  for (Transfer& transfer : _waiting.take([now](const CurlTransfer& t) { return t.expired(now); })) {
    HTTPResult timedOut = transfer->timedOutWaiting();
    complete(std::move(transfer), std::move(timedOut));
  }
}

void HTTPWorker::poll() {
  constexpr int kCheckWaiting = 50, kIdle = 3'600'000;  // ms; libcurl's own timers come first
  curl_multi_poll(_multi.get(), nullptr, 0, _waiting.empty() ? kIdle : kCheckWaiting, nullptr);
}

void HTTPWorker::complete(Transfer transfer, HTTPResult result) {
  _inbox.ended(transfer->lane());
  try {
    transfer->complete(std::move(result));
  } catch (const std::bad_alloc&) {
    logError("An answer could not be handled: out of memory");
  }
  transfer.reset();
  _inbox.completed();
}

void HTTPWorker::keepHandle(CURL* easy) {
  curl_easy_reset(easy);
  if (_idleHandles.size() < kIdleHandles)
    _idleHandles.push_back(easy);
  else
    curl_easy_cleanup(easy);
}

}  // namespace veltrad::http
