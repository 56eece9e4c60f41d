// SPDX-License-Identifier: Apache-2.0
// One HTTPS exchange: its request, the settings of libcurl, and the answer.
#pragma once

#include <curl/curl.h>

#include <array>
#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "http/connections.h"
#include "http/http_client.h"

namespace veltrad::http {

// Constructed on the caller's thread, then used only on the HTTP thread. `connections` must exist while an
// easy handle is attached. Its 25 fields are the request, what libcurl is given, and the answer as it
// arrives.
class CurlTransfer {
 public:
  using Time = std::chrono::steady_clock::time_point;

  CurlTransfer(HTTPRequest request, HTTPCompletion completion, bool blocking, Time now);
  CurlTransfer(const CurlTransfer&) = delete;

  HTTPRequest::Lane lane() const { return _request.lane; }
  // "name:port" as in the URL: connections are counted by it.
  const std::string& host() const { return _host; }
  std::string hostName() const { return http::hostName(_request.url); }
  RequestUnderWay underWay() const { return {_request.lane, _request.events}; }
  // Not of a storebag request.
  Departure departure() const;
  void recordIn(RequestGate& gate, const Departure& departure);
  // 0: it was not recorded.
  std::uint64_t record() const { return _record; }
  bool hasBegun() const { return _begun; }
  int transmissions() const { return _attempts; }
  // True at the first call.
  bool beginsFirst() { return !std::exchange(_begun, true); }
  // Its sender keeps and records it.
  bool isKept() const { return _request.isKept; }
  bool isAgain() const { return _request.again; }
  std::uintptr_t sequence() const { return _request.sequence; }
  Time arrived() const { return _arrived; }
  // True if a thread waits in perform().
  bool blocking() const { return _blocking; }
  bool expired(Time now) const { return _deadline && *_deadline <= now; }

  // Sets up `easy`, which is new or was reset. False, or std::bad_alloc, if there is no memory for it.
  bool attach(CURL* easy, Connections& connections, Time now);
  // The handle that was attached last.
  CURL* easy() const { return _easy; }
  // True if libcurl chose a kept connection that had ended, so that nothing was sent. Attach it again, once,
  // for a new connection.
  bool metEndedConnection() const { return _connection == Connection::ended; }
  // The result for libcurl's code; reads the attached handle.
  HTTPResult result(CURLcode code);
  HTTPResult timedOutWaiting() const;
  static HTTPError stopping();
  // Does not allocate.
  static HTTPError outOfMemory() { return {HTTPError::Kind::shortage, "Out of memory"}; }

  // Runs the completion and destroys it. To be called once, without holding a lock.
  void complete(HTTPResult result);

 private:
  // own: the transfer has opened a connection.
  enum class Connection { kept, ended, own };
  using HeaderList = std::unique_ptr<curl_slist, decltype(&::curl_slist_free_all)>;

  class Options;

  bool setHeaders();
  void setBody(Options& options);
  void setLimits(Options& options, Time now);
  template <typename Piece>
  bool collects(const Piece& piece);
  void collectHeader(std::string_view line);
  const std::string& body() const { return _request.sharedBody ? *_request.sharedBody : _request.body; }
  std::chrono::seconds retryAfter() const;
  bool answerTooLarge() const { return _received > _request.mostResponseBytes; }
  HTTPError::Kind kindOf(CURLcode code) const;
  HTTPError::Cause causeOf(CURLcode code) const;
  std::string describe(CURLcode code) const;

  static curl_socket_t openSocket(void* self, curlsocktype, curl_sockaddr* address);
  static int beforeRequest(void* self, char*, char*, int, int localPort);
  static std::size_t giveBody(char* bytes, std::size_t size, std::size_t count, void* self);
  static std::size_t takeBody(char* bytes, std::size_t size, std::size_t count, void* self);
  static std::size_t takeHeader(char* bytes, std::size_t size, std::size_t count, void* self);

  HTTPRequest _request;
  HTTPCompletion _completion;
  const bool _blocking;
  const std::string _host;
  const std::uint64_t _bodySize;
  const Time _arrived;
  // Absent while an upload or log data waits, and if a minimum speed holds instead.
  std::optional<Time> _deadline;

  CURL* _easy = nullptr;
  Connections* _connections = nullptr;
  Connection _connection = Connection::kept;
  bool _begun = false;
  std::uint64_t _record = 0;
  HeaderList _headerList{nullptr, curl_slist_free_all};
  std::array<char, CURL_ERROR_SIZE> _error{};
  // Bytes of the body's file that were sent.
  std::uint64_t _sent = 0;
  // How often libcurl was about to send the request.
  int _attempts = 0;

  // Failures of callbacks; the numbers are errnos.
  int _socketError = 0;
  int _bodyError = 0;
  bool _memoryShort = false;

  // The answer.
  HTTPHeaders _headers;
  // The next line is a status line or a trailer.
  bool _headersEnded = true;
  std::size_t _headerBytes = 0;
  std::size_t _headerLines = 0;
  std::string _body;
  // Bytes of the body.
  std::size_t _received = 0;
};

}  // namespace veltrad::http
