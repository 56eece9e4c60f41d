// SPDX-License-Identifier: Apache-2.0
// Reads requests one after the other and answers them.
#include "gateway/http_connection.h"

#include <sys/socket.h>

#include <limits>

#include "gateway/attempt.h"

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

std::shared_ptr<HTTPConnection> HTTPConnection::make(Owner& owner, Socket socket) {
  // The last to hold it may be another thread.
  return {new HTTPConnection(owner, std::move(socket)), [](HTTPConnection* last) {
            last->_owner.context.get_executor().dispatch([owned = std::unique_ptr<HTTPConnection>(last)] {},
                                                         HandlerAllocator<void>(last->_memory));
          }};
}

std::function<void()> HTTPConnection::later(Step step) {
  return [self = shared_from_this(), step] {
    self->_owner.context.get_executor().post([self, step] { self->run(step, {}, 0); },
                                             HandlerAllocator<void>(self->_memory));
  };
}

void HTTPConnection::run(Step step, const Error& error, std::size_t count) {
  if (!attempt([&] { (this->*step)(error, count); })) refuseForShortage();
}

// Wants no memory. Nothing is begun, so the connection ends.
void HTTPConnection::refuseForShortage() {
  _owner.ranShort();
  if (_state == State::owesAnswer)
    ::send(_stream.socket().native_handle(), _owner.shortage.data(), _owner.shortage.size(),
           MSG_DONTWAIT | MSG_NOSIGNAL);
}

void HTTPConnection::closeIfIdle() {
  if (_state == State::idle) _stream.cancel();
}

void HTTPConnection::readHead() {
  if (_owner.stopping) return;
  _state = State::idle;
  _parser.emplace();
  _parser->header_limit(static_cast<std::uint32_t>(_owner.bounds.headerBytes));
  // The handler counts the body's bytes.
  _parser->body_limit(std::numeric_limits<std::uint64_t>::max());
  _stream.expires_after(_owner.bounds.idle);
  http::async_read_header(_stream, _buffer, *_parser, then(&HTTPConnection::headRead));
}

void HTTPConnection::headRead(const Error& error, std::size_t) {
  _state = State::owesAnswer;
  if (error) return headRefused(error);
  const auto length = _parser->content_length();
  auto handled =
      _owner.handler(Head(_parser->get(), length ? std::optional<std::uint64_t>(*length) : std::nullopt));
  if (auto* refusal = std::get_if<Answer>(&handled)) return answer(std::move(*refusal), !_parser->is_done());
  _bodyHandler = std::move(std::get<std::unique_ptr<BodyHandler>>(handled));
  if (_parser->is_done()) return finish();
  _parser->get().body().handler = _bodyHandler.get();
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
                           then(&HTTPConnection::goOn));
}

void HTTPConnection::goOn(const Error& error, std::size_t) {
  if (!error) readBody();
}

void HTTPConnection::readBody() {
  if (_parser->is_done()) return finish();
  if (!_bodyHandler->hasRoom(later(&HTTPConnection::goOn))) return _stream.expires_never();
  _waitsSince = std::chrono::steady_clock::now();
  _stream.expires_after(_pace.left());
  http::async_read_some(_stream, _buffer, *_parser, then(&HTTPConnection::bodyRead));
}

void HTTPConnection::bodyRead(const Error& error, std::size_t count) {
  _pace.passed(std::chrono::steady_clock::now() - _waitsSince, count);
  if (auto& refusal = _parser->get().body().refusal) return answer(std::move(*refusal), !_parser->is_done());
  if (!error || error == http::error::need_buffer) return readBody();
  if (error.category() == http::make_error_code(http::error::bad_method).category() &&
      error != http::error::partial_message && error != http::error::end_of_stream)
    answer(Answer{400, "", "", {{"X-VLT-Refused", "the body's chunks are malformed"}}}, true);
}

void HTTPConnection::finish() {
  _buffer.shrink_to_fit();
  _stream.expires_never();
  _bodyHandler->finish(later(&HTTPConnection::finished));
}

void HTTPConnection::finished(const Error&, std::size_t) {
  answer(_bodyHandler->answer(), false);
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
  http::async_write(_stream, *_response, then(&HTTPConnection::answered));
  _state = State::answers;
}

void HTTPConnection::answered(const Error& error, std::size_t) {
  const bool whole = _parser->is_done(), closes = !_response->keep_alive();
  _response.reset();
  _bodyHandler.reset();
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
  _stream.async_read_some(_buffer.prepare(kReadBytes), then(&HTTPConnection::lingered));
}

void HTTPConnection::lingered(const Error& error, std::size_t count) {
  _lingered += count;
  if (!error && _lingered < kMostLingering) linger();
}

}  // namespace veltrad::gateway
