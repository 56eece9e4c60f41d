// SPDX-License-Identifier: Apache-2.0
// Serves HTTP/1.1 on one thread. Bodies are handed on as they come, and an answer may come later, from any
// thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "base/result.h"

namespace veltrad::gateway {

// The head of a request, for the handler. Valid during the call.
class RequestHead {
 public:
  virtual ~RequestHead() = default;
  virtual std::string_view method() const = 0;
  virtual std::string_view target() const = 0;
  // The field's content, letter case of its name ignored; empty: absent.
  virtual std::string_view field(std::string_view name) const = 0;
  // Of the body, where the head says it.
  virtual std::optional<std::uint64_t> length() const = 0;
};

struct Answer {
  int status = 200;
  std::string body;
  std::string type;
  // Further headers.
  std::vector<std::pair<std::string, std::string>> headers;
};

// Takes the body of one request. Used on the server's thread, which destroys it, and not before the end of
// what it was asked for. Where it throws std::bad_alloc, it keeps no function that it was given, and the
// request is refused.
class BodyHandler {
 public:
  virtual ~BodyHandler() = default;
  // Takes the next bytes from the front, not all of them if that were a long turn: the rest comes again after
  // others had theirs. An answer refuses everything: the connection is closed after it, unless it was the
  // end.
  virtual std::optional<Answer> take(std::string_view& bytes) = 0;
  // False: there is no room for more bytes now. `resume`, which wants no memory and throws nothing, is then
  // called once, on any thread, when there is.
  virtual bool hasRoom(std::function<void()> resume) = 0;
  // After the last byte. `done`, which is like `resume`, is called once, on any thread, now or later, and
  // then answer().
  virtual void finish(std::function<void()> done) = 0;
  virtual Answer answer() = 0;
};

class HTTPServer {
 public:
  // Answers a request by its head, or returns the handler of its body. On the server's thread.
  using Handler = std::function<std::variant<Answer, std::unique_ptr<BodyHandler>>(const RequestHead&)>;

  struct Bounds {
    std::size_t connections = 16'000;
    std::size_t headerBytes = 16u << 10;
    // How long a connection may be without a request.
    std::chrono::seconds idle{75};
    // How long a body may be without a byte, or slower than BodyPace allows, and an answer without a byte
    // that is taken.
    std::chrono::seconds stalled{30};
    // The status for a request that there is no memory for.
    int shortage = 503;
  };

  // `onShortage`, which must not throw, is called for each request or connection that ended for want of
  // memory.
  HTTPServer(
      Handler handler, Bounds bounds, std::function<void()> onShortage = [] {});
  ~HTTPServer();

  // Listens on "HOST:PORT" or "unix:PATH", and returns the same with the port that was given for port 0. The
  // error names what was expected. "PATH.lock" says that somebody listens at PATH; it stays.
  Result<std::string, std::string> listen(const std::string& address);
  // Takes no further connections or requests; what has begun is answered. Then calls `done`. Any thread.
  void stop(std::function<void()> done);
  // Serves until end() is called.
  void run();
  // Any thread.
  void end();
  std::size_t connections() const;
  // Whether the thread that serves does something else within this time.
  bool answersWithin(std::chrono::seconds time);

 private:
  struct Library;
  std::unique_ptr<Library> _library;
};

}  // namespace veltrad::gateway
