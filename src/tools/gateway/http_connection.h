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
#include <string>

#include "gateway/http_server.h"

namespace veltrad::gateway {

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
  using Parser = boost::beast::http::request_parser<boost::beast::http::buffer_body>;
  using Response = boost::beast::http::response<boost::beast::http::string_body>;

  void readHead();
  void headRead(const Error& error);
  void headRefused(const Error& error);
  void continueThenRead();
  void readBody();
  void bodyRead(const Error& error, std::size_t count);
  void finish();
  void answer(Answer answer, bool closes);
  void answered(const Error& error, bool closes);
  void linger();

  Owner& _owner;
  boost::beast::basic_stream<Protocol> _stream;
  // What was read and not yet parsed, which is at most a header, or a piece of a body.
  static constexpr std::size_t kMostBuffered = 80u << 10;
  boost::beast::flat_buffer _buffer{kMostBuffered};
  std::optional<Parser> _parser;
  std::unique_ptr<BodyTaker> _taker;
  std::optional<Response> _response;
  // For the body's bytes; without memory between requests.
  std::string _room;
  std::size_t _lingered = 0;
  bool _idle = false;
};

}  // namespace veltrad::gateway
