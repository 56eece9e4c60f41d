// SPDX-License-Identifier: Apache-2.0
// HTTPS requests. Any thread may start one; completions run on the client's thread and must not block.
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
#include "http/host_name.h"
#include "http/request_gate.h"
#include "http/server_records.h"
#include "platform/memory_budget.h"

namespace veltrad::http {

using HTTPHeaders = std::vector<std::pair<std::string, std::string>>;

// A body that is read from the beginning of a file while it is sent.
struct FileBody {
  std::shared_ptr<const FileDescriptor> file;
  std::uint64_t bytes = 0;
};

// Its 18 fields are the request, what is known of its events, and its bounds.
struct HTTPRequest {
  enum class Method { get, post };
  // Decides which limits apply. Storebag requests are always admitted. At most 1,024 event posts are in
  // progress. Three file uploads and three uploads of log data run at a time; the time-out of the others has
  // not begun.
  enum class Lane { storebag, event, upload, logData };

  Method method = Method::get;
  Lane lane = Lane::event;
  // Must begin with https.
  std::string url;
  // Control characters are removed from values. The value of "Content-Length" is replaced by the body's
  // length.
  HTTPHeaders headers;
  std::string body;
  // Instead of `body`.
  std::optional<FileBody> fileBody;
  // Instead of `body`: one that its sender keeps, too.
  std::shared_ptr<const std::string> sharedBody;
  // The sender keeps the request, repeats it if it fails, and records its result. It has an ID, so that the
  // server accepts it only once.
  bool isKept = false;
  // The request was begun before, so its events are counted already.
  bool again = false;
  // The charge for the memory of the request and its completion, made by the caller and released after the
  // completion has run.
  platform::Charge charge;
  // Events in the body; a file and log data are one.
  std::size_t events = 1;
  // As in Departure.
  std::shared_ptr<const Dictionary> client;
  Dictionary about;
  // If false, the answer's body is discarded; one that is too large ends the connection, but the status
  // counts.
  bool keepsAnswer = true;
  // Posts of one sequence to one host begin in order: each when the previous one has ended, or 100 ms after
  // it was started, so that a slow host takes several at once. 0: no sequence.
  std::uintptr_t sequence = 0;
  // For the whole request, waiting included; at most 10 s of it for connecting.
  std::chrono::milliseconds timeout{60'000};
  // If not 0, replaces the time-out: the minimum speed, averaged over 60 s.
  std::uint32_t leastBytesPerSecond = 0;
  // Limit for the answer's body, beyond which the connection is closed. Headers: 64 KiB and 256 lines.
  std::size_t mostResponseBytes = 16u << 20;
};

struct HTTPResponse {
  int status = 0;
  // The headers of the last answer; empty if the answer is not kept.
  HTTPHeaders headers;
  std::string body;
  // The wait in "Retry-After", at most a day; 0 if there is none.
  std::chrono::seconds retryAfter{0};
  // How often the request went out. libcurl repeats one that a kept connection ends without an answer, if it
  // is kept by its sender.
  int transmissions = 0;

  // The first value under this name, letter case ignored.
  std::optional<std::string_view> header(std::string_view name) const;
};

struct HTTPError {
  // transport: refused, not resolved, not trusted, cut, timed out, not https, or headers beyond their limit.
  // tooLarge: the answer is beyond its limit. tooMany: the lane is full. shortage: no descriptor, thread or
  // memory. refused: the owner of the device does not let it leave. With tooMany and shortage nothing was
  // sent.
  enum class Kind { transport, tooLarge, tooMany, shortage, stopping, refused };
  Kind kind = Kind::transport;
  // One line: "Could not resolve host: x".
  std::string description;
  // The status of an incomplete answer; 0 if none arrived.
  int status = 0;
  // Where a transport error ended the exchange.
  enum class Cause { other, resolve, connect, trust, timeout };
  Cause cause = Cause::other;
  // The reason of a refused request.
  std::optional<wire::Reason> refusal = std::nullopt;
  // The request had begun when it ended so.
  bool begun = false;
  // As in HTTPResponse, of an incomplete answer.
  std::chrono::seconds retryAfter{0};
  int transmissions = 0;

  // False: nothing of the request has left the device.
  bool mayHaveArrived() const {
    const bool ended = kind == Kind::refused || kind == Kind::stopping;
    return ended ? begun && refusal != wire::Reason::over_daily_limit
                 : kind != Kind::tooMany && kind != Kind::shortage;
  }
};

// The memory of the request until its completion has run, including libcurl's copies, without the completion
// itself.
std::size_t keptBytes(const HTTPRequest& request);

using HTTPResult = Result<HTTPResponse, HTTPError>;
using HTTPCompletion = std::function<void(HTTPResult)>;

class HTTPClient {
 public:
  virtual ~HTTPClient() = default;
  // If it succeeds, `completion` runs exactly once, never inside this call. Otherwise (tooMany, shortage) it
  // never runs.
  virtual Result<Done, HTTPError> start(HTTPRequest request, HTTPCompletion completion) = 0;
  // Waits for the answer. Fails at once with `stopping` after failBlockingWaits().
  virtual HTTPResult perform(HTTPRequest request) = 0;
  // True if perform() fails at once.
  virtual bool stopping() const { return false; }
};

struct HTTPClientSettings {
  // Certificates in PEM form that are trusted besides the system's. The file may be missing.
  std::string extraCertificatesPath;
  // Asked on the HTTP thread before each request begins; outlives the client. Null: every request may.
  RequestGate* gate = nullptr;
};

// A request that has begun.
struct RequestUnderWay {
  HTTPRequest::Lane lane;
  std::size_t events = 0;
};

// "libcurl/7.88.1 OpenSSL/3.0.15 …": what requests are made with, as loaded.
std::string transportLibraries();

// libcurl's multi interface on one thread, which the first request starts. Never forks; SIGPIPE must be
// ignored.
class CurlHTTPClient final : public HTTPClient {
 public:
  explicit CurlHTTPClient(HTTPClientSettings settings);
  // Ends every transfer with `stopping`.
  ~CurlHTTPClient() override;
  Result<Done, HTTPError> start(HTTPRequest request, HTTPCompletion completion) override;
  HTTPResult perform(HTTPRequest request) override;
  bool stopping() const override;

  // Checks the waiting requests with the gate again and, if `running`, those that have begun; ends refused
  // ones.
  void endRefused(bool running);
  // The same for those that wait, now; with `all`, whatever the gate says of them. Returns what has begun, in
  // both cases without requests for storebags; nothing if that takes longer than `within`.
  std::optional<std::vector<RequestUnderWay>> refuseWaiting(bool all, std::chrono::milliseconds within);
  // From now on perform() fails at once; this ends calls that wait, too.
  void failBlockingWaits();
  // Waits at most until `deadline` for all transfers to end, then ends the others with `stopping`.
  void drain(std::chrono::steady_clock::time_point deadline);
  // True if the thread has run an empty task within this time, or was never started.
  bool passesEmptyTask(std::chrono::milliseconds within);
  // The number of event posts that have not ended.
  std::size_t underWay() const;
  // By address.
  std::vector<ServerRecord> servers() const;

 private:
  struct Impl;
  std::unique_ptr<Impl> _impl;
};

}  // namespace veltrad::http
