// SPDX-License-Identifier: Apache-2.0
// Reads requests one after the other and answers them.
#include "gateway/http_connection.h"

#include <limits>

namespace veltrad::gateway {

namespace beast = boost::beast;
namespace http = boost::beast::http;

namespace {

// A body is read in such pieces.
constexpr std::size_t kReadBytes = 16u << 10;
// After a refusal the rest of a body is read and dropped, because closing at once could cost the answer.
constexpr std::size_t kMostLingering = 32u << 20;
constexpr std::chrono::seconds kLongestLinger{5};

class Head final : public RequestHead {
 public:
  Head(const http::request_header<>& request, std::optional<std::uint64_t> length)
      : _request(request), _length(length) {}
  std::string_view method() const override { return viewOf(_request.method_string()); }
  std::string_view target() const override { return viewOf(_request.target()); }
  std::string_view field(std::string_view name) const override {
    return viewOf(_request[beast::string_view(name.data(), name.size())]);
  }
  std::optional<std::uint64_t> length() const override { return _length; }

 private:
  static std::string_view viewOf(beast::string_view text) { return {text.data(), text.size()}; }

  const http::request_header<>& _request;
  const std::optional<std::uint64_t> _length;
};

}  // namespace

void HTTPConnection::closeIfIdle() {
  if (_idle) _stream.cancel();
}

void HTTPConnection::readHead() {
  if (_owner.stopping) return;
  _idle = true;
  _parser.emplace();
  _parser->header_limit(static_cast<std::uint32_t>(_owner.bounds.headerBytes));
  // Who takes the body counts its bytes.
  _parser->body_limit(std::numeric_limits<std::uint64_t>::max());
  _stream.expires_after(_owner.bounds.idle);
  http::async_read_header(
      _stream, _buffer, *_parser,
      [self = shared_from_this()](const Error& error, std::size_t) { self->headRead(error); });
}

void HTTPConnection::headRead(const Error& error) {
  _idle = false;
  if (error) return headRefused(error);
  const auto length = _parser->content_length();
  auto handled =
      _owner.handler(Head(_parser->get(), length ? std::optional<std::uint64_t>(*length) : std::nullopt));
  if (auto* refusal = std::get_if<Answer>(&handled)) return answer(std::move(*refusal), !_parser->is_done());
  _taker = std::move(std::get<std::unique_ptr<BodyTaker>>(handled));
  if (_parser->is_done()) return finish();
  _parser->get().body().taker = _taker.get();
  _pace = BodyPace(_owner.bounds.stalled);
  _buffer.reserve(kReadBytes);
  continueThenRead();
}

void HTTPConnection::headRefused(const Error& error) {
  if (error.category() != http::make_error_code(http::error::bad_method).category()) return;
  if (error == http::error::end_of_stream || error == http::error::partial_message) return;
  const bool tooLong = error == http::error::header_limit || error == http::error::buffer_overflow;
  answer(Answer{tooLong ? 431 : 400,
                "",
                "",
                {{"X-VLT-Refused", tooLong ? "the header is too large" : "no HTTP/1.1"}}},
         true);
}

void HTTPConnection::continueThenRead() {
  if (!beast::iequals(_parser->get()[http::field::expect], "100-continue")) return readBody();
  static constexpr std::string_view kContinue = "HTTP/1.1 100 Continue\r\n\r\n";
  boost::asio::async_write(_stream, boost::asio::buffer(kContinue.data(), kContinue.size()),
                           [self = shared_from_this()](const Error& error, std::size_t) {
                             if (!error) self->readBody();
                           });
}

void HTTPConnection::readBody() {
  if (_parser->is_done()) return finish();
  const auto resume = [self = shared_from_this()] {
    boost::asio::post(self->_stream.get_executor(), [self] { self->readBody(); });
  };
  if (!_taker->hasRoom(resume)) return _stream.expires_never();
  const auto begun = std::chrono::steady_clock::now();
  _stream.expires_after(_pace.left());
  http::async_read_some(_stream, _buffer, *_parser,
                        [self = shared_from_this(), begun](const Error& error, std::size_t count) {
                          self->_pace.passed(std::chrono::steady_clock::now() - begun, count);
                          self->bodyRead(error);
                        });
}

void HTTPConnection::bodyRead(const Error& error) {
  if (auto& refusal = _parser->get().body().refusal) return answer(std::move(*refusal), !_parser->is_done());
  if (!error || error == http::error::need_buffer) return readBody();
  if (error.category() == http::make_error_code(http::error::bad_method).category() &&
      error != http::error::partial_message && error != http::error::end_of_stream)
    answer(Answer{400, "", "", {{"X-VLT-Refused", "the body's chunks are malformed"}}}, true);
}

void HTTPConnection::finish() {
  _buffer.shrink_to_fit();
  _stream.expires_never();
  _taker->finish([self = shared_from_this()](Answer made) {
    boost::asio::post(self->_stream.get_executor(),
                      [self, made = std::move(made)]() mutable { self->answer(std::move(made), false); });
  });
}

void HTTPConnection::answer(Answer made, bool closes) {
  closes = closes || _owner.stopping || !_parser->get().keep_alive();
  _response.emplace();
  _response->version(11);
  _response->result(static_cast<unsigned>(made.status));
  _response->keep_alive(!closes);
  for (const auto& [name, text] : made.headers) _response->set(name, text);
  if (!made.type.empty()) _response->set(http::field::content_type, made.type);
  _response->body() = std::move(made.body);
  _response->prepare_payload();
  _stream.expires_after(_owner.bounds.stalled);
  http::async_write(_stream, *_response,
                    [self = shared_from_this(), closes](const Error& error, std::size_t) {
                      self->answered(error, closes);
                    });
}

void HTTPConnection::answered(const Error& error, bool closes) {
  const bool whole = _parser->is_done();
  _response.reset();
  _taker.reset();
  if (error) return;
  if (!closes) {
    _buffer.shrink_to_fit();
    return readHead();
  }
  Error ignored;
  _stream.socket().shutdown(Socket::shutdown_send, ignored);
  if (whole) return;
  _parser.reset();
  _buffer.clear();
  _stream.expires_after(kLongestLinger);
  linger();
}

void HTTPConnection::linger() {
  _stream.async_read_some(_buffer.prepare(kReadBytes),
                          [self = shared_from_this()](const Error& error, std::size_t count) {
                            self->_lingered += count;
                            if (!error && self->_lingered < kMostLingering) self->linger();
                          });
}

}  // namespace veltrad::gateway
