// SPDX-License-Identifier: Apache-2.0
// One connection of the HTTP server, on the server's thread.
#pragma once

// Asio 1.74 uses std::exchange without including this.
#include <utility>

#include <boost/asio.hpp>
#include <boost/beast/core.hpp>
#include <boost/beast/http.hpp>

#include <memory>
#include <optional>
#include <string_view>

#include "gateway/body_pace.h"
#include "gateway/handler_memory.h"
#include "gateway/http_server.h"

namespace veltrad::gateway {

// A body as Beast sees it: its bytes go to the handler, and none are kept.
struct ForwardedBody {
  struct value_type {
    BodyHandler* handler = nullptr;
    std::optional<Answer> refusal = std::nullopt;
  };

  class reader {
   public:
    template <bool isRequest, class Fields>
    reader(boost::beast::http::header<isRequest, Fields>&, value_type& body) : _body(body) {}

    void init(const boost::optional<std::uint64_t>&, boost::system::error_code& error) { error = {}; }
    // What the handler leaves stays in the connection's buffer for its next turn.
    std::size_t put(const boost::asio::const_buffer& given, boost::system::error_code& error) {
      std::string_view bytes(static_cast<const char*>(given.data()), given.size());
      _body.refusal = _body.handler->take(bytes);
      if (_body.refusal) bytes = {};
      error = {};
      if (!bytes.empty()) error = boost::beast::http::error::need_buffer;
      return given.size() - bytes.size();
    }
    void finish(boost::system::error_code& error) { error = {}; }

   private:
    value_type& _body;
  };
};

// Its fields are those of one request, but for the stream and the owner. It lives as long as an operation or
// an answer of it is under way. What it does is done in steps, each of which begins the next one last; one
// that finds no memory ends the connection, with a refusal if no answer has begun.
class HTTPConnection : public std::enable_shared_from_this<HTTPConnection> {
 public:
  using Protocol = boost::asio::generic::stream_protocol;
  using Socket = boost::asio::basic_stream_socket<Protocol>;

  // The server, as its connections see it.
  struct Owner {
    using Socket = HTTPConnection::Socket;
    explicit Owner(boost::asio::io_context& runs) : context(runs) {}
    virtual ~Owner() = default;
    virtual void closed(HTTPConnection& connection) = 0;
    // A request was not served for want of memory.
    virtual void ranShort() = 0;

    HTTPServer::Handler handler;
    HTTPServer::Bounds bounds;
    // What such a request is answered.
    std::string shortage;
    bool stopping = false;
    boost::asio::io_context& context;
  };

  static std::shared_ptr<HTTPConnection> make(Owner& owner, Socket socket);
  ~HTTPConnection() { _owner.closed(*this); }

  void start() { readHead(); }
  // Closes the connection if it is between two requests.
  void closeIfIdle();

 private:
  using Error = boost::system::error_code;
  using Parser = boost::beast::http::request_parser<ForwardedBody>;
  using Response = boost::beast::http::response<boost::beast::http::string_body>;
  using Step = void (HTTPConnection::*)(const Error& error, std::size_t count);
  enum class State { idle, owesAnswer, answers };

  HTTPConnection(Owner& owner, Socket socket) : _owner(owner), _stream(std::move(socket)) {}
  // The handler of an operation.
  auto then(Step step) {
    return [self = shared_from_this(), step](const Error& error, std::size_t count) {
      self->run(step, error, count);
    };
  }
  // The same for any thread, once for each wait.
  std::function<void()> later(Step step);
  void run(Step step, const Error& error, std::size_t count);
  void refuseForShortage();

  void readHead();
  void headRead(const Error& error, std::size_t count);
  void headRefused(const Error& error);
  void continueThenRead();
  void goOn(const Error& error, std::size_t count);
  void readBody();
  void bodyRead(const Error& error, std::size_t count);
  void finish();
  void finished(const Error& error, std::size_t count);
  void answer(Answer answer, bool closes);
  void answered(const Error& error, std::size_t count);
  void linger();
  void lingered(const Error& error, std::size_t count);

  Owner& _owner;
  boost::beast::basic_stream<Protocol> _stream;
  HandlerMemory _memory;
  // Bytes that were read and not parsed yet: at most a header, a chunk's line, or a piece of a body.
  boost::beast::flat_buffer _buffer{std::size_t{64} << 10};
  std::optional<Parser> _parser;
  std::unique_ptr<BodyHandler> _bodyHandler;
  std::optional<Response> _response;
  // Of the body.
  BodyPace _pace{_owner.bounds.stalled};
  std::chrono::steady_clock::time_point _waitsSince;
  std::size_t _lingered = 0;
  State _state = State::idle;
};

}  // namespace veltrad::gateway
