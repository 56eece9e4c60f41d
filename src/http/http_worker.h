// The HTTP thread's loop: libcurl's multi interface, and every completion.
#pragma once

#include <curl/curl.h>

#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "http/curl_transfer.h"
#include "http/http_inbox.h"
#include "http/http_waiting.h"
#include "http/kept_connections.h"
#include "http/trust_store.h"

namespace veltrad::http {

// Everything but make() and wake() on the HTTP thread. `inbox` must outlive it. Memory that is short ends the
// transfer that needs it, not the thread.
class HTTPWorker {
 public:
  // Null: libcurl has no memory or descriptors for it just now. libcurl stays initialised.
  static std::unique_ptr<HTTPWorker> make(HTTPInbox& inbox, std::string extraCertificatesPath);
  ~HTTPWorker();
  HTTPWorker(const HTTPWorker&) = delete;
  HTTPWorker& operator=(const HTTPWorker&) = delete;

  // Returns when the inbox says it was the last time and nothing is left.
  void run();
  // Any thread, as long as the object lives.
  void wake() { curl_multi_wakeup(_multi.get()); }

 private:
  using Multi = std::unique_ptr<CURLM, decltype(&curl_multi_cleanup)>;
  using Transfer = HTTPWaiting::Transfer;
  static constexpr std::size_t kIdleHandles = 8;

  HTTPWorker(HTTPInbox& inbox, Multi multi, std::string extraCertificatesPath);
  void arrive(HTTPInbox::Transfers transfers);
  void end(const HTTPWaiting::Predicate& matches);
  void startNext();
  void startOne(Transfer transfer);
  bool runs(CURL* easy, Transfer& transfer);
  void finish();
  void endExpired();
  void poll();
  void complete(Transfer transfer, HTTPResult result);
  void keepHandle(CURL* easy);

  // HTTP thread only, but for the inbox and wake()
  HTTPInbox& _inbox;
  TrustStore _trust;
  HTTPWaiting _waiting;
  KeptConnections _connections;
  const Multi _multi;  // before what it uses goes
  std::unordered_map<CURL*, Transfer> _running;
  std::vector<CURL*> _idleHandles;  // their set-up costs more than a reset
};

}  // namespace veltrad::http
