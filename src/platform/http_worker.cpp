// The HTTP thread's loop.
#include "platform/http_worker.h"

#include <pthread.h>

#include <cstdlib>
#include <utility>

namespace veltrad::platform {

HTTPWorker::HTTPWorker(HTTPInbox& inbox, std::string extraCertificatesPath)
    : _inbox(inbox),
      _multi(makeMulti()),
      _wakeable(_curl.multiWakeup(_multi) == CURLM_OK),  // not without descriptors
      _trust(std::move(extraCertificatesPath)) {}

CURLM* HTTPWorker::makeMulti() const {
  if (_curl.globalInit(CURL_GLOBAL_DEFAULT) != CURLE_OK)
    std::abort();  // counted: each client has its own pair
  CURLM* multi = _curl.multiInit();
  if (multi == nullptr) std::abort();
  _curl.multiSetopt(multi, CURLMOPT_PIPELINING, CURLPIPE_NOTHING);
  _curl.multiSetopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS, static_cast<long>(HTTPWaiting::kConnections));
  _curl.multiSetopt(multi, CURLMOPT_MAXCONNECTS, 8L);  // kept alive
  return multi;
}

HTTPWorker::~HTTPWorker() {
  for (CURL* easy : _idleHandles) _curl.easyCleanup(easy);
  _curl.multiCleanup(_multi);
  _curl.globalCleanup();
}

void HTTPWorker::wake() {
  _curl.multiWakeup(_multi);
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
    _curl.multiPerform(_multi, &running);
    finish();
    endExpired();
    startNext();
    if (!taken.last) poll();  // else it goes round until nothing is left, completions' own requests included
  }
}

void HTTPWorker::arrive(std::vector<Transfer> transfers) {
  for (Transfer& transfer : transfers) {
    if (transfer->refused()) {
      HTTPError error = *transfer->refused();
      complete(std::move(transfer), Failure{std::move(error)});
    } else {
      _waiting.add(std::move(transfer));
    }
  }
}

void HTTPWorker::end(const HTTPWaiting::Predicate& matches) {
  std::vector<Transfer> ending = _waiting.take(matches);
  for (auto at = _running.begin(); at != _running.end();) {
    if (!matches(*at->second)) {
      ++at;
      continue;
    }
    _curl.multiRemoveHandle(_multi, at->first);
    keepHandle(at->first);
    _waiting.ended(*at->second);
    ending.push_back(std::move(at->second));
    at = _running.erase(at);
  }
  for (Transfer& transfer : ending) complete(std::move(transfer), Failure{CurlTransfer::stopping()});
}

void HTTPWorker::startNext() {
  const auto now = std::chrono::steady_clock::now();
  while (Transfer transfer = _waiting.next(now)) startOne(std::move(transfer));
}

void HTTPWorker::startOne(Transfer transfer) {
  CURL* easy = _idleHandles.empty() ? _curl.easyInit() : _idleHandles.back();
  if (!_idleHandles.empty()) _idleHandles.pop_back();
  const bool ready = easy != nullptr &&
                     transfer->attach(_curl, easy, _trust, _connections, std::chrono::steady_clock::now()) &&
                     _curl.multiAddHandle(_multi, easy) == CURLM_OK;
  if (ready) {
    _running.emplace(easy, std::move(transfer));
    return;
  }
  if (easy != nullptr) keepHandle(easy);
  _waiting.ended(*transfer);
  complete(std::move(transfer),
           Failure{HTTPError{HTTPError::Kind::transport, _curl.easyStrerror(CURLE_OUT_OF_MEMORY)}});
}

void HTTPWorker::finish() {
  int left = 0;
  while (const CURLMsg* message = _curl.multiInfoRead(_multi, &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    CURL* easy = message->easy_handle;
    const CURLcode code = message->data.result;
    const auto found = _running.find(easy);
    Transfer transfer = std::move(found->second);
    _running.erase(found);
    HTTPResult result = transfer->result(code, easy);
    _curl.multiRemoveHandle(_multi, easy);
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
    HTTPError error = transfer->timedOutWaiting();
    complete(std::move(transfer), Failure{std::move(error)});
  }
}

void HTTPWorker::poll() {
  constexpr int kCheckWaiting = 50, kUnwoken = 100,
                kIdle = 3'600'000;  // ms; libcurl's own timers come first
  const int most = !_wakeable ? kUnwoken : _waiting.empty() ? kIdle : kCheckWaiting;
  _curl.multiPoll(_multi, nullptr, 0, most, nullptr);
}

void HTTPWorker::complete(Transfer transfer, HTTPResult result) {
  _inbox.ended(*transfer);
  transfer->complete(std::move(result));
  _inbox.completed();
}

void HTTPWorker::keepHandle(CURL* easy) {
  _curl.easyReset(easy);
  if (_idleHandles.size() < kIdleHandles)
    _idleHandles.push_back(easy);
  else
    _curl.easyCleanup(easy);
}

}  // namespace veltrad::platform
