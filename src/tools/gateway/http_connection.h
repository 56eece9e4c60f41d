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
#include "gateway/http_server.h"

namespace veltrad::gateway {

// A body as Beast sees it: its bytes go to who takes them, and none are kept.
struct TakenBody {
  struct value_type {
    BodyTaker* taker = nullptr;
    std::optional<Answer> refusal = std::nullopt;
  };

  class reader {
   public:
    template <bool isRequest, class Fields>
    reader(boost::beast::http::header<isRequest, Fields>&, value_type& body) : _body(body) {}

    void init(const boost::optional<std::uint64_t>&, boost::system::error_code& error) { error = {}; }
    // What the taker leaves stays in the connection's buffer for its next turn.
    std::size_t put(const boost::asio::const_buffer& given, boost::system::error_code& error) {
      std::string_view bytes(static_cast<const char*>(given.data()), given.size());
      _body.refusal = _body.taker->take(bytes);
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
// an answer of it is under way.
class HTTPConnection : public std::enable_shared_from_this<HTTPConnection> {
 public:
  using Protocol = boost::asio::generic::stream_protocol;
  using Socket = boost::asio::basic_stream_socket<Protocol>;

  // The server, as its connections see it.
  struct Owner {
    using Socket = HTTPConnection::Socket;
    Owner(HTTPServer::Handler given, HTTPServer::Bounds kept) : handler(std::move(given)), bounds(kept) {}
    virtual ~Owner() = default;
    virtual void closed(HTTPConnection& connection) = 0;

    const HTTPServer::Handler handler;
    const HTTPServer::Bounds bounds;
    bool stopping = false;
  };

  HTTPConnection(Owner& owner, Socket socket) : _owner(owner), _stream(std::move(socket)) {}
  ~HTTPConnection() { _owner.closed(*this); }

  void start() { readHead(); }
  // Closes the connection if it is between two requests.
  void closeIfIdle();

 private:
  using Error = boost::system::error_code;
  using Parser = boost::beast::http::request_parser<TakenBody>;
  using Response = boost::beast::http::response<boost::beast::http::string_body>;

  void readHead();
  void headRead(const Error& error);
  void headRefused(const Error& error);
  void continueThenRead();
  void readBody();
  void bodyRead(const Error& error);
  void finish();
  void answer(Answer answer, bool closes);
  void answered(const Error& error, bool closes);
  void linger();

  Owner& _owner;
  boost::beast::basic_stream<Protocol> _stream;
  // What was read and not yet parsed: at most a header, a chunk's line, or a piece of a body.
  boost::beast::flat_buffer _buffer{std::size_t{64} << 10};
  std::optional<Parser> _parser;
  std::unique_ptr<BodyTaker> _taker;
  std::optional<Response> _response;
  // Of the body.
  BodyPace _pace{_owner.bounds.stalled};
  std::size_t _lingered = 0;
  bool _idle = false;
};

}  // namespace veltrad::gateway
