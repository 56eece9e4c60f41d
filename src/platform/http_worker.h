// The HTTP thread's loop: libcurl's multi interface, and every completion.
#pragma once

#include <curl/curl.h>

#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/curl_library.h"
#include "platform/curl_transfer.h"
#include "platform/http_inbox.h"
#include "platform/http_waiting.h"
#include "platform/kept_connections.h"
#include "platform/trust_store.h"

namespace veltrad::platform {

// Everything but wake() on the HTTP thread. `inbox` must outlive it.
class HTTPWorker {
 public:
  HTTPWorker(HTTPInbox& inbox, std::string extraCertificatesPath);
  ~HTTPWorker();
  HTTPWorker(const HTTPWorker&) = delete;
  HTTPWorker& operator=(const HTTPWorker&) = delete;

  // Returns when the inbox says it was the last time and nothing is left.
  void run();
  // Any thread, as long as the object lives.
  void wake();

 private:
  using Transfer = std::unique_ptr<CurlTransfer>;
  static constexpr std::size_t kIdleHandles = 8;

  CURLM* makeMulti() const;
  void arrive(std::vector<Transfer> transfers);
  void end(const HTTPWaiting::Predicate& matches);
  void startNext();
  void startOne(Transfer transfer);
  void finish();
  void endExpired();
  void poll();
  void complete(Transfer transfer, HTTPResult result);
  void keepHandle(CURL* easy);

  // constant after construction
  HTTPInbox& _inbox;
  const CurlLibrary _curl;
  CURLM* const _multi;
  const bool _wakeable;

  // HTTP thread only
  TrustStore _trust;
  HTTPWaiting _waiting;
  KeptConnections _connections;
  std::unordered_map<CURL*, Transfer> _running;
  std::vector<CURL*> _idleHandles;  // their set-up costs more than a reset
};

}  // namespace veltrad::platform
