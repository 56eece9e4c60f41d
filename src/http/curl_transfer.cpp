// SPDX-License-Identifier: Apache-2.0
// The settings of libcurl for a transfer, and its callbacks.
#include "http/curl_transfer.h"

#include <openssl/ssl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

#include "base/text.h"
#include "http/header_lines.h"
#include "http/host_name.h"
#include "platform/shortage.h"

namespace veltrad::http {

namespace {

// libcurl's texts.
constexpr std::string_view kNoResolverThread = "getaddrinfo() thread failed to start";
constexpr std::string_view kResolvingTimedOut = "Resolving timed out";
constexpr long kConnectSeconds = 10;
constexpr long kLowSpeedSeconds = 60;
constexpr std::size_t kMostHeaderBytes = 64u << 10;
constexpr std::size_t kMostHeaderLines = 256;  // libcurl's time is quadratic in them

bool isControl(char c) {
  return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
}

std::string_view trimmed(std::string_view text) {
  const auto blank = [](char c) { return c == ' ' || isControl(c); };
  while (!text.empty() && blank(text.front())) text.remove_prefix(1);
  while (!text.empty() && blank(text.back())) text.remove_suffix(1);
  return text;
}

CURLcode setStore(CURL*, void* context, void* connections) {
  try {
    X509_STORE* store = static_cast<Connections*>(connections)->trusted();
    if (store == nullptr) return CURLE_OUT_OF_MEMORY;
    SSL_CTX_set1_cert_store(static_cast<SSL_CTX*>(context), store);
    return CURLE_OK;
  } catch (const std::bad_alloc&) {
    return CURLE_OUT_OF_MEMORY;
  }
}

// True if fewer descriptors are left than libc and OpenSSL need to resolve a name or to find a certificate.
// Their errors do not tell that descriptors were missing.
bool descriptorsAreShort() {
  std::array<FileDescriptor, 4> some;
  return std::any_of(some.begin(), some.end(), [](FileDescriptor& one) {
    one.reset(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    return !one.isOpen() && platform::isShortage(errno);
  });
}

}  // namespace

// Sets options and remembers whether all were accepted: a missing one may be a protection.
class CurlTransfer::Options {
 public:
  explicit Options(CURL* easy) : _easy(easy) {}
  template <typename Value>
  void set(CURLoption option, Value value) {
    _taken = _taken && curl_easy_setopt(_easy, option, value) == CURLE_OK;
  }
  bool taken() const { return _taken; }

 private:
  CURL* const _easy;
  bool _taken = true;
};

CurlTransfer::CurlTransfer(HTTPRequest request, HTTPCompletion completion, bool blocking, Time now)
    : _request(std::move(request)),
      _completion(std::move(completion)),
      _blocking(blocking),
      _host(authorityOf(_request.url)),
      _bodySize(_request.fileBody ? _request.fileBody->bytes : body().size()),
      _arrived(now) {
  const bool waitsForItsLane =
      _request.lane == HTTPRequest::Lane::upload || _request.lane == HTTPRequest::Lane::logData;
  if (!waitsForItsLane && _request.leastBytesPerSecond == 0) _deadline = now + _request.timeout;
}

bool CurlTransfer::attach(CURL* easy, Connections& connections, Time now) {
  Options options(easy);
  _easy = easy;
  _connections = &connections;
  options.set(CURLOPT_URL, _request.url.c_str());
  options.set(CURLOPT_PROTOCOLS_STR, "https");
  options.set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  options.set(CURLOPT_FOLLOWLOCATION, 0L);
  options.set(CURLOPT_NETRC, static_cast<long>(CURL_NETRC_IGNORED));
  options.set(CURLOPT_PROXY, "");  // ignores the environment, too
  options.set(CURLOPT_NOSIGNAL, 1L);
  options.set(CURLOPT_QUICK_EXIT, 1L);  // does not wait for a resolver that hangs
  options.set(CURLOPT_OPENSOCKETFUNCTION, openSocket);
  options.set(CURLOPT_OPENSOCKETDATA, this);
  options.set(CURLOPT_CLOSESOCKETFUNCTION, Connections::close);
  options.set(CURLOPT_CLOSESOCKETDATA, _connections);
  // A storebag request uses a new connection, so that the server's certificate is checked now.
  const bool fresh = metEndedConnection() || _request.lane == HTTPRequest::Lane::storebag;
  options.set(CURLOPT_FRESH_CONNECT, fresh ? 1L : 0L);
  _connection = Connection::kept;
  _error[0] = '\0';
  options.set(CURLOPT_ERRORBUFFER, _error.data());
  options.set(CURLOPT_PREREQFUNCTION, beforeRequest);
  options.set(CURLOPT_PREREQDATA, this);
  options.set(CURLOPT_WRITEFUNCTION, takeBody);
  options.set(CURLOPT_WRITEDATA, this);
  options.set(CURLOPT_HEADERFUNCTION, takeHeader);
  options.set(CURLOPT_HEADERDATA, this);
  setBody(options);
  setLimits(options, now);
  options.set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
  options.set(CURLOPT_SSL_VERIFYPEER, 1L);
  options.set(CURLOPT_SSL_VERIFYHOST, 2L);
  options.set(CURLOPT_SSL_SESSIONID_CACHE, 0L);  // checks the certificate of every connection
  // Only the shared store is used: libcurl would load one for each connection, and cache ours after it was
  // replaced.
  options.set(CURLOPT_CA_CACHE_TIMEOUT, 0L);
  options.set(CURLOPT_CAINFO, static_cast<char*>(nullptr));
  options.set(CURLOPT_CAPATH, static_cast<char*>(nullptr));
  options.set(CURLOPT_SSL_CTX_FUNCTION, setStore);
  options.set(CURLOPT_SSL_CTX_DATA, _connections);
  return options.taken() && setHeaders();
}

bool CurlTransfer::setHeaders() {
  _headerList.reset();
  for (const std::string& line : headerLines(_request.headers, _bodySize)) {
    curl_slist* longer = curl_slist_append(_headerList.get(), line.c_str());
    if (longer == nullptr) return false;
    (void)_headerList.release();
    _headerList.reset(longer);
  }
  return curl_easy_setopt(_easy, CURLOPT_HTTPHEADER, _headerList.get()) == CURLE_OK;
}

Departure CurlTransfer::departure() const {
  using Kind = Departure::Kind;
  const Kind kind = _request.lane == HTTPRequest::Lane::event    ? Kind::post
                    : _request.lane == HTTPRequest::Lane::upload ? Kind::file
                                                                 : Kind::logData;
  return {kind, _request.url, _request.events, _bodySize, _request.client, _request.about};
}

void CurlTransfer::recordIn(RequestGate& gate, const Departure& departure) {
  _record = gate.record(departure, sentLines(_host, headerLines(_request.headers, _bodySize)), body(),
                        _request.fileBody ? _request.fileBody->file : nullptr);
}

void CurlTransfer::setBody(Options& options) {
  if (_request.method == HTTPRequest::Method::get) return options.set(CURLOPT_HTTPGET, 1L);
  options.set(CURLOPT_POST, 1L);
  options.set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_bodySize));
  if (!_request.fileBody) return options.set(CURLOPT_POSTFIELDS, body().data());  // not copied
  // Without a seek function, because it is never sent twice.
  _sent = 0;
  options.set(CURLOPT_READFUNCTION, giveBody);
  options.set(CURLOPT_READDATA, this);
}

std::size_t CurlTransfer::giveBody(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const auto most = std::min<std::uint64_t>(size * count, transfer._bodySize - transfer._sent);
  if (most == 0) return 0;
  ssize_t length = 0;
  do {
    length = pread(transfer._request.fileBody->file->get(), bytes, most, static_cast<off_t>(transfer._sent));
  } while (length < 0 && errno == EINTR);
  if (length <= 0) {
    transfer._bodyError = length == 0 ? ENODATA : errno;
    return CURL_READFUNC_ABORT;
  }
  transfer._sent += static_cast<std::uint64_t>(length);
  return static_cast<std::size_t>(length);
}

curl_socket_t CurlTransfer::openSocket(void* self, curlsocktype, curl_sockaddr* address) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  transfer._connection = Connection::own;
  const curl_socket_t made = transfer._connections->open(*address);
  transfer._socketError = made == CURL_SOCKET_BAD && platform::isShortage(errno) ? errno : 0;
  return made;
}

// Aborts on a kept connection that has ended. Also aborts a repeated post: libcurl repeats a request if a
// kept connection ends without an answer, but the server may have read it, and a post without an ID must not
// be sent twice.
int CurlTransfer::beforeRequest(void* self, char*, char*, int, int localPort) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  if (transfer._attempts > 0 && transfer._request.method == HTTPRequest::Method::post && !transfer.isKept())
    return CURL_PREREQFUNC_ABORT;
  if (transfer._connection == Connection::kept && transfer._connections->ended(localPort)) {
    transfer._connection = Connection::ended;
    return CURL_PREREQFUNC_ABORT;
  }
  ++transfer._attempts;
  return CURL_PREREQFUNC_OK;
}

void CurlTransfer::setLimits(Options& options, Time now) {
  options.set(CURLOPT_CONNECTTIMEOUT, kConnectSeconds);
  if (_request.leastBytesPerSecond != 0) {
    options.set(CURLOPT_LOW_SPEED_LIMIT, static_cast<long>(_request.leastBytesPerSecond));
    options.set(CURLOPT_LOW_SPEED_TIME, kLowSpeedSeconds);
    return;
  }
  if (!_deadline) _deadline = now + _request.timeout;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(*_deadline - now).count();
  options.set(CURLOPT_TIMEOUT_MS, std::max<long>(1, left));  // 0 would mean no limit
}

// Runs `piece` if the answer is kept. False if memory is short.
template <typename Piece>
bool CurlTransfer::collects(const Piece& piece) {
  try {
    if (_request.keepsAnswer) piece();
  } catch (const std::bad_alloc&) {
    _memoryShort = true;
  }
  return !_memoryShort;
}

std::size_t CurlTransfer::takeBody(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const std::size_t length = size * count;
  transfer._received += length;
  if (transfer.answerTooLarge()) return CURL_WRITEFUNC_ERROR;
  return transfer.collects([&] { transfer._body.append(bytes, length); }) ? length : CURL_WRITEFUNC_ERROR;
}

// Called for each line, those of interim answers and trailers included.
std::size_t CurlTransfer::takeHeader(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const std::size_t length = size * count;
  transfer._headerBytes += length;
  if (transfer._headerBytes > kMostHeaderBytes || ++transfer._headerLines > kMostHeaderLines)
    return CURL_WRITEFUNC_ERROR;
  return transfer.collects([&] { transfer.collectHeader({bytes, length}); }) ? length : CURL_WRITEFUNC_ERROR;
}

void CurlTransfer::collectHeader(std::string_view line) {
  const bool continues = line.front() == ' ' || line.front() == '\t';
  line = trimmed(line);
  if (_headersEnded && line.starts_with("HTTP/")) {  // otherwise a trailer, which is ignored
    _headersEnded = false;
    _headers.clear();
  } else if (line.empty() && !continues) {
    _headersEnded = true;
  } else if (!_headersEnded && continues && !_headers.empty()) {
    _headers.back().second.append(" ").append(line);
  } else if (const std::size_t colon = line.find(':'); !_headersEnded && colon != std::string_view::npos) {
    _headers.emplace_back(trimmed(line.substr(0, colon)), trimmed(line.substr(colon + 1)));
  }
}

HTTPResult CurlTransfer::result(CURLcode code) {
  long status = 0;
  curl_easy_getinfo(_easy, CURLINFO_RESPONSE_CODE, &status);
  const bool statusCounts = code == CURLE_OK || (answerTooLarge() && !_request.keepsAnswer);
  if (statusCounts)
    return HTTPResponse{static_cast<int>(status), std::move(_headers), std::move(_body), retryAfter(),
                        _attempts};
  HTTPError error{kindOf(code), {}, static_cast<int>(status), causeOf(code)};
  error.retryAfter = retryAfter();
  try {
    error.description = describe(code);
  } catch (const std::bad_alloc&) {
    error.description = outOfMemory().description;
  }
  return Failure{std::move(error)};
}

std::chrono::seconds CurlTransfer::retryAfter() const {
  constexpr curl_off_t kDay = 86'400;
  curl_off_t seconds = 0;  // negative for a date in the past
  curl_easy_getinfo(_easy, CURLINFO_RETRY_AFTER, &seconds);
  return std::chrono::seconds(std::clamp<curl_off_t>(seconds, 0, kDay));
}

HTTPError::Kind CurlTransfer::kindOf(CURLcode code) const {
  using Kind = HTTPError::Kind;
  if (answerTooLarge()) return Kind::tooLarge;
  if (_attempts > 0) return Kind::transport;
  if (_socketError != 0 || code == CURLE_OUT_OF_MEMORY) return Kind::shortage;
  if (code == CURLE_COULDNT_RESOLVE_HOST && std::string_view(_error.data()).starts_with(kNoResolverThread))
    return Kind::shortage;
  const bool neededFiles = code == CURLE_COULDNT_RESOLVE_HOST || code == CURLE_PEER_FAILED_VERIFICATION;
  return neededFiles && descriptorsAreShort() ? Kind::shortage : Kind::transport;
}

HTTPError::Cause CurlTransfer::causeOf(CURLcode code) const {
  using Cause = HTTPError::Cause;
  switch (code) {
    case CURLE_COULDNT_RESOLVE_HOST:
      return Cause::resolve;
    case CURLE_COULDNT_CONNECT:
      return Cause::connect;
    case CURLE_PEER_FAILED_VERIFICATION:
      return Cause::trust;
    case CURLE_OPERATION_TIMEDOUT:
      return std::string_view(_error.data()).starts_with(kResolvingTimedOut) ? Cause::resolve
                                                                             : Cause::timeout;
    default:
      return Cause::other;
  }
}

std::string CurlTransfer::describe(CURLcode code) const {
  if (_memoryShort) return outOfMemory().description;
  if (_headerBytes > kMostHeaderBytes || _headerLines > kMostHeaderLines)
    return "The answer's headers are over " + std::to_string(kMostHeaderBytes) + " bytes or " +
           std::to_string(kMostHeaderLines) + " lines";
  if (answerTooLarge())
    return "The answer is larger than " + std::to_string(_request.mostResponseBytes) + " bytes";
  if (_bodyError != 0)
    return std::string("The file to send cannot be read as far as it should: ") + strerrordesc_np(_bodyError);
  if (_socketError != 0) return std::string("No socket can be opened: ") + strerrordesc_np(_socketError);
  if (code == CURLE_ABORTED_BY_CALLBACK)
    return "Empty reply from server";  // libcurl's text for a new connection
  std::string text = _error[0] != '\0' ? _error.data() : curl_easy_strerror(code);
  while (!text.empty() && isControl(text.back())) text.pop_back();
  std::replace_if(text.begin(), text.end(), isControl, ' ');
  return text;
}

HTTPError CurlTransfer::stopping() {
  try {
    return {HTTPError::Kind::stopping, "The daemon is stopping"};
  } catch (const std::bad_alloc&) {
    return {HTTPError::Kind::stopping, outOfMemory().description};
  }
}

HTTPResult CurlTransfer::timedOutWaiting() const {
  try {
    return Failure{HTTPError{HTTPError::Kind::transport,
                             "Timed out after " + std::to_string(_request.timeout.count()) +
                                 " milliseconds while waiting for a connection to " + _host,
                             0, HTTPError::Cause::timeout}};
  } catch (const std::bad_alloc&) {
    return Failure{outOfMemory()};
  }
}

void CurlTransfer::complete(HTTPResult result) {
  const HTTPCompletion completion = std::exchange(_completion, nullptr);
  if (completion) completion(std::move(result));
}

}  // namespace veltrad::http
