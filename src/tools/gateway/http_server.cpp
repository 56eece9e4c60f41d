// SPDX-License-Identifier: Apache-2.0
// Accepts connections, with Boost.Beast, which only this file and http_connection.cpp include.
#include "gateway/http_server.h"

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <charconv>
#include <cstring>
#include <future>
#include <set>

#include "base/file_descriptor.h"
#include "gateway/attempt.h"
#include "gateway/http_connection.h"
#include "platform/daemon_lock.h"
#include "platform/limited_line.h"
#include "platform/log.h"

namespace veltrad::gateway {

namespace {

// How long no connection is accepted while descriptors or memory are short.
constexpr std::chrono::milliseconds kShortagePause{100};

struct HostAndPort {
  std::string host;
  std::uint16_t port = 0;
};

std::optional<HostAndPort> hostAndPortOf(const std::string& address) {
  const std::size_t colon = address.rfind(':');
  if (colon == std::string::npos) return std::nullopt;
  HostAndPort found{address.substr(0, colon), 0};
  const char* end = address.data() + address.size();
  const auto read = std::from_chars(address.data() + colon + 1, end, found.port);
  if (read.ec != std::errc() || read.ptr != end) return std::nullopt;
  if (found.host.starts_with('[') && found.host.ends_with(']'))
    found.host = found.host.substr(1, found.host.size() - 2);
  return found;
}

}  // namespace

struct HTTPServer::Library : HTTPConnection::Owner {
  Library() : HTTPConnection::Owner(ownContext), acceptor(ownContext), pause(ownContext) {}

  void run();
  void accept();
  void accepted(const boost::system::error_code& error, Socket socket);
  void closed(HTTPConnection& connection) override;
  void ranShort() override;
  void say(const std::string& failure);
  void stopNow();

  // One thread runs the context, so nothing here is locked. The context is destroyed before what its
  // connections use.
  // Of a Unix socket; empty: it is none.
  std::string path;
  FileDescriptor lock;
  std::set<HTTPConnection*> connections;
  std::atomic<std::size_t> count{0};
  std::function<void()> stopped;
  std::function<void()> onShortage;
  platform::LimitedLine shortages{"failures"};
  HandlerMemory acceptMemory;
  // Held by the handler of an accept.
  std::weak_ptr<void> accepting;
  boost::asio::io_context ownContext{1};
  boost::asio::basic_socket_acceptor<boost::asio::generic::stream_protocol> acceptor;
  boost::asio::steady_timer pause;
};

// What finds no memory ends where it is: an operation of a connection, and with it the connection, or an
// accept, which is begun again here.
void HTTPServer::Library::run() {
  const auto work = boost::asio::make_work_guard(context);
  bool rests = false;
  while (!context.stopped()) {
    const bool found = attempt([&] {
      if (rests) context.run_for(kShortagePause);
      accept();
      context.run();
    });
    rests = !found;
    if (rests) ranShort();
  }
}

void HTTPServer::Library::ranShort() {
  onShortage();
  attempt([this] { say("http: a connection was not served: there is no memory"); });
}

void HTTPServer::Library::say(const std::string& failure) {
  if (const auto line = shortages.happened(failure)) logWarning("%s", line->c_str());
}

void HTTPServer::Library::accept() {
  if (stopping || !accepting.expired() || connections.size() >= bounds.connections) return;
  auto pending = std::make_shared<char>();
  accepting = pending;
  acceptor.async_accept(
      [this, pending = std::move(pending)](const boost::system::error_code& error, Socket socket) mutable {
        pending.reset();
        accepted(error, std::move(socket));
      });
}

void HTTPServer::Library::accepted(const boost::system::error_code& error, Socket socket) {
  if (stopping) return;
  if (error) {
    say("http: a connection was not accepted: " + error.message());
    pause.expires_after(kShortagePause);
    pause.async_wait([this](const boost::system::error_code& cancelled) {
      if (!cancelled) accept();
    });
    return;
  }
  boost::system::error_code ignored;
  socket.set_option(boost::asio::ip::tcp::no_delay(true), ignored);
  const auto connection = HTTPConnection::make(*this, std::move(socket));
  connections.insert(connection.get());
  count = connections.size();
  connection->start();
  accept();
}

void HTTPServer::Library::closed(HTTPConnection& connection) {
  const bool wasFull = connections.size() >= bounds.connections;
  connections.erase(&connection);
  count = connections.size();
  if (stopping && connections.empty() && stopped) return std::exchange(stopped, nullptr)();
  if (wasFull && !stopping)
    context.get_executor().post([this] { accept(); }, HandlerAllocator<void>(acceptMemory));
}

void HTTPServer::Library::stopNow() {
  stopping = true;
  boost::system::error_code ignored;
  acceptor.close(ignored);
  pause.cancel();
  if (!path.empty()) ::unlink(path.c_str());
  if (connections.empty()) return stopped ? std::exchange(stopped, nullptr)() : void();
  // Closing changes the set.
  const std::vector<HTTPConnection*> open(connections.begin(), connections.end());
  for (HTTPConnection* connection : open) connection->closeIfIdle();
}

HTTPServer::HTTPServer(Handler handler, Bounds bounds, std::function<void()> onShortage)
    : _library(std::make_unique<Library>()) {
  const auto reason = boost::beast::http::obsolete_reason(
      boost::beast::http::int_to_status(static_cast<unsigned>(bounds.shortage)));
  _library->shortage = fmt::format(
      "HTTP/1.1 {} {}\r\nX-VLT-Refused: no_memory\r\nRetry-After: 10\r\nContent-Length: 0\r\nConnection: "
      "close\r\n\r\n",
      bounds.shortage, std::string_view(reason.data(), reason.size()));
  _library->handler = std::move(handler);
  _library->bounds = bounds;
  _library->onShortage = std::move(onShortage);
}

HTTPServer::~HTTPServer() {
  // Connections are closed without an answer, with the context's handlers.
  _library->stopping = true;
  _library->stopped = nullptr;
}

Result<std::string, std::string> HTTPServer::listen(const std::string& address) {
  namespace asio = boost::asio;
  asio::generic::stream_protocol::endpoint endpoint;
  std::string host;
  if (address.starts_with("unix:")) {
    const std::string path = address.substr(5);
    if (path.empty() || path.size() >= sizeof(sockaddr_un::sun_path))
      return Failure{address + ": a socket's path has 1 to 107 bytes"};
    // Whoever has the lock may remove a socket, because nobody listens to it.
    auto lock = platform::takeDaemonLock(path + ".lock");
    if (!lock) return Failure{address + ": " + lock.error().description};
    _library->lock = std::move(lock).value();
    _library->path = path;
    struct stat left {};
    if (::lstat(path.c_str(), &left) == 0 && S_ISSOCK(left.st_mode)) ::unlink(path.c_str());
    endpoint = asio::local::stream_protocol::endpoint(path);
  } else {
    const auto parts = hostAndPortOf(address);
    boost::system::error_code wrong;
    const auto ip = parts ? asio::ip::make_address(parts->host, wrong) : asio::ip::address();
    if (!parts || wrong)
      return Failure{address + ": expected ADDRESS:PORT, with an IP address, or unix:PATH"};
    host = parts->host;
    endpoint = asio::ip::tcp::endpoint(ip, parts->port);
  }
  boost::system::error_code error;
  auto& acceptor = _library->acceptor;
  acceptor.open(endpoint.protocol(), error);
  if (!error) acceptor.set_option(asio::socket_base::reuse_address(true), error);
  if (!error) acceptor.bind(endpoint, error);
  if (!error) acceptor.listen(asio::socket_base::max_listen_connections, error);
  if (error) {
    _library->path.clear();
    return Failure{address + ": " + error.message()};
  }
  // nginx has another user; who may connect is decided by the folder.
  if (!_library->path.empty()) ::chmod(_library->path.c_str(), 0666);
  _library->accept();
  if (!_library->path.empty()) return address;
  const auto bound = acceptor.local_endpoint();
  sockaddr_storage storage{};
  std::memcpy(&storage, bound.data(), std::min<std::size_t>(bound.size(), sizeof storage));
  const std::uint16_t port =
      ntohs(storage.ss_family == AF_INET6 ? reinterpret_cast<const sockaddr_in6*>(&storage)->sin6_port
                                          : reinterpret_cast<const sockaddr_in*>(&storage)->sin_port);
  return (host.find(':') == std::string::npos ? host : "[" + host + "]") + ":" + std::to_string(port);
}

void HTTPServer::stop(std::function<void()> done) {
  boost::asio::post(_library->context, [library = _library.get(), done = std::move(done)]() mutable {
    library->stopped = std::move(done);
    library->stopNow();
  });
}

void HTTPServer::run() {
  _library->run();
}

void HTTPServer::end() {
  _library->context.stop();
}

bool HTTPServer::answersWithin(std::chrono::seconds time) {
  const auto passed = std::make_shared<std::promise<void>>();
  boost::asio::post(_library->context, [passed] { passed->set_value(); });
  return passed->get_future().wait_for(time) == std::future_status::ready;
}

std::size_t HTTPServer::connections() const {
  return _library->count;
}

}  // namespace veltrad::gateway
