// One HTTPS exchange: its request, how libcurl is set up for it, and what came back. HTTP thread once it is
// filed.
#pragma once

#include <curl/curl.h>

#include <array>
#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "http/connections.h"
#include "http/http_client.h"

namespace veltrad::http {

// Made on the caller's thread, then the HTTP thread's alone. While an easy handle is attached, `connections`
// must live. Its 24 fields are the request, what libcurl is given, and the answer as it comes.
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
  std::uintptr_t sequence() const { return _request.sequence; }
  Time arrived() const { return _arrived; }
  bool blocking() const { return _blocking; }  // somebody waits in perform()
  bool expired(Time now) const { return _deadline && *_deadline <= now; }

  // Sets `easy` up, which is fresh or reset. False, or std::bad_alloc: there is no memory for it.
  bool attach(CURL* easy, Connections& connections, Time now);
  CURL* easy() const { return _easy; }  // the one attached last
  // The kept connection that libcurl chose had ended, so nothing was sent: attach again, once; it then gets a
  // new one.
  bool metEndedConnection() const { return _connection == Connection::ended; }
  // What libcurl's verdict means; reads the attached handle.
  HTTPResult result(CURLcode code);
  HTTPResult timedOutWaiting() const;
  static HTTPError stopping() { return {HTTPError::Kind::stopping, "The daemon is stopping"}; }
  static HTTPError outOfMemory() {
    return {HTTPError::Kind::shortage, "Out of memory"};
  }  // allocates nothing

  // Once, without any lock; lets the completion go. What the request keeps, and its charge, go with the
  // object.
  void complete(HTTPResult result);

 private:
  enum class Connection { kept, ended, own };  // as far as is known: `own` once it has opened one
  using HeaderList = std::unique_ptr<curl_slist, decltype(&::curl_slist_free_all)>;

  class Options;

  bool setHeaders();
  void setBody(Options& options);
  void setLimits(Options& options, Time now);
  template <typename Piece>
  bool collects(const Piece& piece);
  void collectHeader(std::string_view line);
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
  std::optional<Time> _deadline;  // of uploads and log data once they run; none: a least speed holds instead

  CURL* _easy = nullptr;
  Connections* _connections = nullptr;
  Connection _connection = Connection::kept;
  HeaderList _headerList{nullptr, curl_slist_free_all};
  std::array<char, CURL_ERROR_SIZE> _error{};
  std::uint64_t _sent = 0;  // of the body's file
  int _attempts = 0;        // how often libcurl was about to send the request

  // What went wrong in a callback
  int _socketError = 0;  // EMFILE and its like
  int _bodyError = 0;
  bool _memoryShort = false;

  // The answer
  HTTPHeaders _headers;
  bool _headersEnded = true;  // what comes next is a status line, or a trailer
  std::size_t _headerBytes = 0;
  std::size_t _headerLines = 0;
  std::string _body;
  std::size_t _received = 0;  // of the body
};

}  // namespace veltrad::http
