// HTTPS requests. Any thread may start one; completions run on the client's own thread and must not block.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/file_descriptor.h"
#include "base/result.h"
#include "http/server_records.h"
#include "platform/memory_budget.h"

namespace veltrad::http {

using HTTPHeaders = std::vector<std::pair<std::string, std::string>>;

// A body that is read from a file's beginning as it is sent.
struct FileBody {
  std::shared_ptr<const FileDescriptor> file;
  std::uint64_t bytes = 0;
};

struct HTTPRequest {
  enum class Method { get, post };
  // What bounds apply. Storebag requests are always admitted; at most 1,024 event posts are under way; three
  // file uploads run at a time and three of log data, others wait, and their time has not begun.
  enum class Lane { storebag, event, upload, logData };

  Method method = Method::get;
  Lane lane = Lane::event;
  std::string url;  // https only
  HTTPHeaders
      headers;  // control characters are removed from values; "Content-Length" is always the body's own
  std::string body;
  std::optional<FileBody> fileBody;  // instead of `body`
  // What the request and its completion keep, charged by its maker; paid back after the completion has run.
  platform::Charge charge;
  // False: the answer's body is thrown away as it comes, and one that is too large ends the connection but
  // not the request: its status counts.
  bool keepsAnswer = true;
  // Posts of one sequence to one host begin in order: each when the one before it has ended, but 100 ms after
  // it came at the latest, so that a slow host takes several at once. 0: none.
  std::uintptr_t sequence = 0;
  std::chrono::milliseconds timeout{60'000};  // total, waiting included; connecting alone at most 10 s
  // Instead of a total time: at least this many bytes a second over 60 s (uploads); 0: `timeout` holds.
  std::uint32_t leastBytesPerSecond = 0;
  // Of the answer's body, counted as bytes come; beyond it the connection is closed. Headers: 64 KiB and 256
  // lines at most.
  std::size_t mostResponseBytes = 16u << 20;
};

struct HTTPResponse {
  int status = 0;
  HTTPHeaders headers;  // of the last answer, names as sent; none where the answer is not kept
  std::string body;

  // The first value under this name, letter case ignored.
  std::optional<std::string_view> header(std::string_view name) const;
};

struct HTTPError {
  enum class Kind {
    transport,  // refused, unresolvable, not trusted, cut, timed out, headers over their bound; not https
    tooLarge,   // the answer is over its bound; `status` is the answer's
    tooMany,    // over the lane's bound; nothing was sent
    shortage,   // no descriptor, thread or memory for it just now; nothing was sent
    stopping,   // the daemon is stopping
  };
  // Where a transport error ended the exchange.
  enum class Cause { other, resolve, connect, trust, timeout };
  Kind kind = Kind::transport;
  std::string description;  // one line, a system text: "Could not resolve host: x"
  int status = 0;           // of an answer that then was cut; 0: none came
  Cause cause = Cause::other;
};

// What the request keeps until its completion has run, what libcurl copies of it included; not what the
// completion itself keeps.
std::size_t keptBytes(const HTTPRequest& request);

using HTTPResult = Result<HTTPResponse, HTTPError>;
using HTTPCompletion = std::function<void(HTTPResult)>;

class HTTPClient {
 public:
  virtual ~HTTPClient() = default;
  // Done: `completion` will run exactly once, never inside this call. Else the request was not taken
  // (tooMany, shortage) and the completion never runs.
  virtual Result<Done, HTTPError> start(HTTPRequest request, HTTPCompletion completion) = 0;
  // Waits for the answer on the caller's thread; fails at once with `stopping` after failBlockingWaits().
  virtual HTTPResult perform(HTTPRequest request) = 0;
  // perform() fails at once: work that leads to one can be given up.
  virtual bool stopping() const { return false; }
};

struct HTTPClientSettings {
  std::string extraCertificatesPath;  // PEM, trusted beside the system's; no such file: none
};

// "libcurl/7.88.1 OpenSSL/3.0.15 …": what requests are made with, as loaded.
std::string transportLibraries();

// libcurl's multi interface on one thread, which starts with the first request; where it cannot, the next
// request tries again. Never forks; SIGPIPE must be ignored.
class CurlHTTPClient final : public HTTPClient {
 public:
  explicit CurlHTTPClient(HTTPClientSettings settings);
  ~CurlHTTPClient() override;  // ends every transfer with `stopping`, then joins
  Result<Done, HTTPError> start(HTTPRequest request, HTTPCompletion completion) override;
  HTTPResult perform(HTTPRequest request) override;
  bool stopping() const override;

  // From now on perform() fails at once, those that wait included.
  void failBlockingWaits();
  // Waits until no transfer is under way, at most until `deadline`; what is left then ends with `stopping`.
  void drain(std::chrono::steady_clock::time_point deadline);
  // True when an empty task passed the thread within `within`; true also when the thread was never started.
  bool passesEmptyTask(std::chrono::milliseconds within);
  // Event posts that have neither completed nor failed.
  std::size_t underWay() const;
  // By address.
  std::vector<ServerRecord> servers() const;

 private:
  struct Impl;
  std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::http
