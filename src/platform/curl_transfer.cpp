// The rules for libcurl: what is switched off, what is bounded, what is verified. HTTP thread.
#include "platform/curl_transfer.h"

#include <openssl/ssl.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <string_view>
#include <utility>

#include "base/text.h"

namespace veltrad::platform {

namespace {

constexpr long kConnectSeconds = 10;
constexpr long kLowSpeedSeconds = 60;
constexpr std::size_t kMostHeaderBytes = 256u << 10;

bool isControl(char c) {
  return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
}

// A token of RFC 9110, 5.6.2.
bool isToken(std::string_view name) {
  const auto allowed = [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte < 0x80 &&
           (std::isalnum(byte) != 0 || std::string_view("!#$%&'*+-.^_`|~").find(c) != std::string_view::npos);
  };
  return !name.empty() && std::all_of(name.begin(), name.end(), allowed);
}

// "name: value" for libcurl, in whose notation an empty value is "name;".
std::string headerLine(std::string_view name, std::string_view value) {
  std::string clean(value);
  clean.erase(std::remove_if(clean.begin(), clean.end(), isControl), clean.end());
  clean.erase(0, clean.find_first_not_of(' '));
  std::string line(name);
  return clean.empty() ? line + ";" : line + ": " + clean;
}

// What stands between "//" and the path.
std::string hostOf(std::string_view url) {
  const std::size_t slashes = url.find("//");
  if (slashes != std::string_view::npos) url.remove_prefix(slashes + 2);
  return std::string(url.substr(0, url.find_first_of("/?#")));
}

CURLcode setStore(CURL*, void* context, void* trust) {
  X509_STORE* store = static_cast<TrustStore*>(trust)->current();
  if (store == nullptr) return CURLE_OUT_OF_MEMORY;
  SSL_CTX_set1_cert_store(static_cast<SSL_CTX*>(context), store);
  return CURLE_OK;
}

}  // namespace

CurlTransfer::CurlTransfer(HTTPRequest request, HTTPCompletion completion, bool blocking, Time now)
    : _request(std::move(request)),
      _completion(std::move(completion)),
      _blocking(blocking),
      _host(hostOf(_request.url)),
      _bodySize(_request.body.size()),
      _arrived(now),
      _deadline(_request.leastBytesPerSecond == 0 ? std::optional<Time>(now + _request.timeout)
                                                  : std::nullopt) {}

void CurlTransfer::refuse(HTTPError error) {
  _refused = std::move(error);
  std::string().swap(_request.body);
}

bool CurlTransfer::attach(const CurlLibrary& curl, CURL* easy, TrustStore& trust,
                          KeptConnections& connections, Time now) {
  _curl = &curl;
  _connections = &connections;
  if (_curl->easySetopt(easy, CURLOPT_URL, _request.url.c_str()) != CURLE_OK || !setHeaders(easy))
    return false;
  _curl->easySetopt(easy, CURLOPT_PROTOCOLS_STR, "https");
  _curl->easySetopt(easy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  _curl->easySetopt(easy, CURLOPT_FOLLOWLOCATION, 0L);
  _curl->easySetopt(easy, CURLOPT_NETRC, static_cast<long>(CURL_NETRC_IGNORED));
  _curl->easySetopt(easy, CURLOPT_PROXY, "");  // nor one from the environment
  _curl->easySetopt(easy, CURLOPT_NOSIGNAL, 1L);
  _curl->easySetopt(easy, CURLOPT_QUICK_EXIT, 1L);  // a dead resolver must not hold the thread
  _curl->easySetopt(easy, CURLOPT_OPENSOCKETFUNCTION, openSocket);
  _curl->easySetopt(easy, CURLOPT_OPENSOCKETDATA, this);
  _curl->easySetopt(easy, CURLOPT_CLOSESOCKETFUNCTION, KeptConnections::close);
  _curl->easySetopt(easy, CURLOPT_CLOSESOCKETDATA, _connections);
  _curl->easySetopt(easy, CURLOPT_FRESH_CONNECT, metEndedConnection() ? 1L : 0L);
  _connection = Connection::kept;
  _error[0] = '\0';
  _curl->easySetopt(easy, CURLOPT_ERRORBUFFER, _error.data());
  _curl->easySetopt(easy, CURLOPT_WRITEFUNCTION, takeBody);
  _curl->easySetopt(easy, CURLOPT_WRITEDATA, this);
  _curl->easySetopt(easy, CURLOPT_HEADERFUNCTION, takeHeader);
  _curl->easySetopt(easy, CURLOPT_HEADERDATA, this);
  setBody(easy);
  setLimits(easy, now);
  setTrust(easy, trust);
  return true;
}

bool CurlTransfer::setHeaders(CURL* easy) {
  _headerList = HeaderList(nullptr, _curl->slistFreeAll);
  // What libcurl would add by itself, unless the request has its own.
  std::array<std::pair<const char*, bool>, 2> own{{{"Accept", false}, {"Content-Type", false}}};
  bool lengthSaid = false;  // in its place among the others; what the request says of it does not count
  const auto append = [this](const std::string& line) {
    curl_slist* longer = _curl->slistAppend(_headerList.get(), line.c_str());
    if (longer == nullptr) return false;
    (void)_headerList.release();
    _headerList = HeaderList(longer, _curl->slistFreeAll);
    return true;
  };
  for (const auto& [name, value] : _request.headers) {
    const std::string_view given = name;
    const auto is = [given](const char* other) { return equalIgnoringCase(given, other); };
    if (!isToken(given) || is("Transfer-Encoding") || is("Expect")) continue;
    for (auto& [automatic, found] : own) found = found || is(automatic);
    if (is("Content-Length")) {
      if (std::exchange(lengthSaid, true)) continue;
      if (!append(headerLine("Content-Length", std::to_string(_bodySize)))) return false;
    } else if (!append(headerLine(name, value))) {
      return false;
    }
  }
  for (const auto& [automatic, found] : own) {
    if (!found && !append(std::string(automatic) + ":")) return false;
  }
  return append("Expect:") && _curl->easySetopt(easy, CURLOPT_HTTPHEADER, _headerList.get()) == CURLE_OK;
}

void CurlTransfer::setBody(CURL* easy) {
  if (_request.method == HTTPRequest::Method::get) {
    _curl->easySetopt(easy, CURLOPT_HTTPGET, 1L);
    return;
  }
  _curl->easySetopt(easy, CURLOPT_PREREQFUNCTION, beforeRequest);
  _curl->easySetopt(easy, CURLOPT_PREREQDATA, this);
  _curl->easySetopt(easy, CURLOPT_POST, 1L);
  _curl->easySetopt(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_request.body.size()));
  _curl->easySetopt(easy, CURLOPT_POSTFIELDS, _request.body.data());  // not copied
}

curl_socket_t CurlTransfer::openSocket(void* self, curlsocktype, curl_sockaddr* address) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  transfer._connection = Connection::own;
  return transfer._connections->open(*address);
}

// Not on a kept connection that has ended. And not again: libcurl repeats a request when a kept connection
// ends without a byte; the server may have read it all the same, and a post is never sent twice.
int CurlTransfer::beforeRequest(void* self, char*, char*, int, int localPort) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  if (transfer._attempts > 0) return CURL_PREREQFUNC_ABORT;
  if (transfer._connection == Connection::kept && transfer._connections->ended(localPort)) {
    transfer._connection = Connection::ended;
    return CURL_PREREQFUNC_ABORT;
  }
  ++transfer._attempts;
  return CURL_PREREQFUNC_OK;
}

void CurlTransfer::setLimits(CURL* easy, Time now) {
  _curl->easySetopt(easy, CURLOPT_CONNECTTIMEOUT, kConnectSeconds);
  if (_deadline) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*_deadline - now).count();
    _curl->easySetopt(easy, CURLOPT_TIMEOUT_MS, std::max<long>(1, left));  // 0 would be no limit at all
    return;
  }
  _curl->easySetopt(easy, CURLOPT_LOW_SPEED_LIMIT, static_cast<long>(_request.leastBytesPerSecond));
  _curl->easySetopt(easy, CURLOPT_LOW_SPEED_TIME, kLowSpeedSeconds);
}

void CurlTransfer::setTrust(CURL* easy, TrustStore& trust) {
  _curl->easySetopt(easy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
  _curl->easySetopt(easy, CURLOPT_SSL_VERIFYPEER, 1L);
  _curl->easySetopt(easy, CURLOPT_SSL_VERIFYHOST, 2L);
  _curl->easySetopt(easy, CURLOPT_SSL_SESSIONID_CACHE, 0L);  // every connection has its certificate checked
  // The shared store alone: libcurl would load its own for each connection, and its cache would keep ours
  // when it has been replaced.
  _curl->easySetopt(easy, CURLOPT_CA_CACHE_TIMEOUT, 0L);
  _curl->easySetopt(easy, CURLOPT_CAINFO, nullptr);
  _curl->easySetopt(easy, CURLOPT_CAPATH, nullptr);
  _curl->easySetopt(easy, CURLOPT_SSL_CTX_FUNCTION, setStore);
  _curl->easySetopt(easy, CURLOPT_SSL_CTX_DATA, &trust);
}

bool CurlTransfer::admits(std::size_t more) {
  _received += more;  // far below overflow: libcurl hands over at most some hundred KiB at a time
  return _received <= _request.mostResponseBytes;
}

std::size_t CurlTransfer::takeBody(char* bytes, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const std::size_t length = size * count;
  if (!transfer.admits(length)) return CURL_WRITEFUNC_ERROR;
  transfer._body.append(bytes, length);
  return length;
}

std::size_t CurlTransfer::takeHeader(char*, std::size_t size, std::size_t count, void* self) {
  auto& transfer = *static_cast<CurlTransfer*>(self);
  const std::size_t length = size * count;
  // libcurl keeps the headers; here they are only counted, those of interim answers and trailers too.
  transfer._headerBytes += length;
  return transfer._headerBytes <= kMostHeaderBytes && transfer.admits(length) ? length : CURL_WRITEFUNC_ERROR;
}

HTTPResult CurlTransfer::result(CURLcode code, CURL* easy) {
  long status = 0;
  _curl->easyGetinfo(easy, CURLINFO_RESPONSE_CODE, &status);
  if (code != CURLE_OK)
    return Failure{HTTPError{HTTPError::Kind::transport, describe(code), static_cast<int>(status)}};
  HTTPResponse response;
  response.status = static_cast<int>(status);
  curl_header* header = nullptr;  // libcurl leaves the line break of an empty value
  while ((header = _curl->easyNextheader(easy, CURLH_HEADER, -1, header)) != nullptr) {
    std::string value = header->value;
    while (!value.empty() && (isControl(value.back()) || value.back() == ' ')) value.pop_back();
    response.headers.emplace_back(header->name, std::move(value));
  }
  response.body = std::move(_body);
  return response;
}

std::string CurlTransfer::describe(CURLcode code) const {
  if (_headerBytes > kMostHeaderBytes) {
    return "The answer's headers are larger than " + std::to_string(kMostHeaderBytes) + " bytes";
  }
  if (_received > _request.mostResponseBytes) {
    return "The answer is larger than " + std::to_string(_request.mostResponseBytes) + " bytes";
  }
  if (code == CURLE_ABORTED_BY_CALLBACK)
    return "Empty reply from server";  // as libcurl says on a new connection
  std::string text = _error[0] != '\0' ? _error.data() : _curl->easyStrerror(code);
  while (!text.empty() && isControl(text.back())) text.pop_back();
  std::replace_if(text.begin(), text.end(), isControl, ' ');
  return text;
}

HTTPError CurlTransfer::timedOutWaiting() const {
  return {HTTPError::Kind::transport, "Timed out after " + std::to_string(_request.timeout.count()) +
                                          " milliseconds while waiting for a connection to " + _host};
}

void CurlTransfer::complete(HTTPResult result) {
  const HTTPCompletion completion = std::exchange(_completion, nullptr);
  if (completion) completion(std::move(result));
}

}  // namespace veltrad::platform
