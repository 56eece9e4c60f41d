// One HTTPS exchange: its request, how libcurl is set up for it, and what came back. HTTP thread once it is
// filed.
#pragma once

#include <curl/curl.h>

#include <array>
#include <chrono>
#include <memory>
#include <optional>
#include <string>

#include "platform/curl_library.h"
#include "platform/http_client.h"
#include "platform/kept_connections.h"
#include "platform/trust_store.h"

namespace veltrad::platform {

// Made on the caller's thread, then the HTTP thread's alone. While an easy handle is attached, `trust` and
// `connections` must live.
class CurlTransfer {
 public:
  using Time = std::chrono::steady_clock::time_point;

  CurlTransfer(HTTPRequest request, HTTPCompletion completion, bool blocking, Time now);
  CurlTransfer(const CurlTransfer&) = delete;
  CurlTransfer& operator=(const CurlTransfer&) = delete;

  HTTPRequest::Lane lane() const { return _request.lane; }
  const std::string& host() const {
    return _host;
  }  // "name:port" as the URL has it: what connections are counted by
  std::size_t bodySize() const { return _bodySize; }
  std::uintptr_t sequence() const { return _request.sequence; }
  Time arrived() const { return _arrived; }
  bool blocking() const { return _blocking; }  // somebody waits in perform()
  bool expired(Time now) const { return _deadline && *_deadline <= now; }

  // Over its lane's bound: the body is let go, and it only waits to be told.
  void refuse(HTTPError error);
  const std::optional<HTTPError>& refused() const { return _refused; }

  // Sets `easy` up, which is fresh or reset. False: libcurl has no memory for it.
  bool attach(const CurlLibrary& curl, CURL* easy, TrustStore& trust, KeptConnections& connections, Time now);
  // The kept connection that libcurl chose had ended, so nothing was sent: attach again, once; it then gets a
  // new one.
  bool metEndedConnection() const { return _connection == Connection::ended; }
  // What libcurl's verdict means; reads the attached handle.
  HTTPResult result(CURLcode code, CURL* easy);
  HTTPError timedOutWaiting() const;
  static HTTPError stopping() { return {HTTPError::Kind::stopping, "The daemon is stopping"}; }

  // Once, without any lock; lets the completion go.
  void complete(HTTPResult result);

 private:
  enum class Connection { kept, ended, own };  // as far as is known: `own` once it has opened one
  using HeaderList = std::unique_ptr<curl_slist, decltype(&::curl_slist_free_all)>;

  bool setHeaders(CURL* easy);
  void setBody(CURL* easy);
  void setLimits(CURL* easy, Time now);
  void setTrust(CURL* easy, TrustStore& trust);
  bool admits(std::size_t more);
  std::string describe(CURLcode code) const;

  static curl_socket_t openSocket(void* self, curlsocktype, curl_sockaddr* address);
  static int beforeRequest(void* self, char*, char*, int, int localPort);
  static std::size_t takeBody(char* bytes, std::size_t size, std::size_t count, void* self);
  static std::size_t takeHeader(char* bytes, std::size_t size, std::size_t count, void* self);

  HTTPRequest _request;
  HTTPCompletion _completion;
  const bool _blocking;
  const std::string _host;
  const std::size_t _bodySize;
  const Time _arrived;
  const std::optional<Time> _deadline;  // none: a least speed holds instead
  std::optional<HTTPError> _refused;

  const CurlLibrary* _curl = nullptr;
  KeptConnections* _connections = nullptr;
  Connection _connection = Connection::kept;
  HeaderList _headerList{nullptr, nullptr};
  std::array<char, CURL_ERROR_SIZE> _error{};
  std::string _body;
  int _attempts = 0;          // how often libcurl was about to send the request
  std::size_t _received = 0;  // header and body bytes
  std::size_t _headerBytes = 0;
};

}  // namespace veltrad::platform
