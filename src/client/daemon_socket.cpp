// SPDX-License-Identifier: Apache-2.0
// Connects to the daemon and exchanges hellos. Every failure has a text that says what to do.
#include "client/daemon_socket.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <system_error>

#include "base/filled_text.h"
#include "base/property_list.h"
#include "base/text.h"
#include "client/answer.h"
#include "wire/names.h"

namespace veltrad::client {

namespace key = wire::key;

namespace {

std::string errorText(int number) {
  return std::error_code(number, std::generic_category()).message();
}

double seconds(std::chrono::milliseconds time) {
  return std::chrono::duration<double>(time).count();
}

ConnectFailure noDaemon(std::string text) {
  return {VELTRA_NO_DAEMON, std::move(text)};
}

const char* kindOfNonSocket(mode_t mode) {
  if (S_ISDIR(mode)) return "a directory";
  if (S_ISREG(mode)) return "a regular file";
  return "no socket";
}

ConnectFailure notVeltrad(const std::string& shown) {
  return noDaemon(
      filled("What listens on {} does not answer like veltrad: stop it and start veltrad.", shown));
}

// connect() reports a file of another kind in the same way as a socket that nobody serves.
ConnectFailure refusedConnection(const std::string& shown, const std::string& path) {
  struct stat facts {};
  if (::stat(path.c_str(), &facts) == 0 && !S_ISSOCK(facts.st_mode)) {
    return noDaemon(
        filled("{} is {}, not the daemon's socket: remove it and start veltrad, or name another "
               "root with VELTRA_ROOT or --root.",
               shown, kindOfNonSocket(facts.st_mode)));
  }
  return noDaemon(filled("The daemon that made {} has ended: start veltrad again.", shown));
}

ConnectFailure connectFailure(int error, const std::string& path, std::chrono::milliseconds patience) {
  const std::string shown = escapedForLog(path);
  switch (error) {
    case ENOENT:
      return noDaemon(filled(
          "No daemon listens on {}: start veltrad, or name its root with VELTRA_ROOT or --root.", shown));
    case ECONNREFUSED:
      return refusedConnection(shown, path);
    case EACCES:
      return noDaemon(
          filled("This user may not open {}: make its directories searchable and the socket "
                 "writable for everyone.",
                 shown));
    case EPROTOTYPE:
      return noDaemon(
          filled("{} is a socket of another type, not the daemon's: remove it and start veltrad.", shown));
    case EAGAIN:
      return noDaemon(
          filled("The daemon on {} accepted no connection within {} s: see whether it is stuck or "
                 "overloaded.",
                 shown, seconds(patience)));
    default:
      return noDaemon(filled("Connecting to {} failed: {}.", shown, errorText(error)));
  }
}

Result<sockaddr_un, ConnectFailure> addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) {
    return Failure{ConnectFailure{
        VELTRA_INVALID,
        filled("The root is too long: the socket's path {} has {} bytes, and at most {} are possible; name a "
               "shorter root with VELTRA_ROOT or --root.",
               escapedForLog(path), path.size(), sizeof address.sun_path - 1)}};
  }
  std::memcpy(address.sun_path, path.data(), path.size());
  return address;
}

// `patience` limits the wait for a place in the listener's backlog, and the sending of the first frames; none
// means not to wait.
Result<FileDescriptor, ConnectFailure> connectTo(const std::string& path,
                                                 std::chrono::milliseconds patience) {
  const auto address = addressOf(path);
  if (!address) return Failure{address.error()};
  const int waits = patience.count() == 0 ? SOCK_NONBLOCK : 0;
  FileDescriptor made(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | waits, 0));
  if (!made.isOpen()) return Failure{noDaemon(filled("No socket could be made: {}.", errorText(errno)))};
  const timeval bound{patience.count() / 1000, patience.count() % 1000 * 1000};
  ::setsockopt(made.get(), SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof bound);
  int failed;
  do {
    failed = ::connect(made.get(), reinterpret_cast<const sockaddr*>(&address.value()), sizeof(sockaddr_un));
  } while (failed != 0 && errno == EINTR);
  if (failed != 0) return Failure{connectFailure(errno, path, patience)};
  return made;
}

bool sendAll(int socket, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

}  // namespace

std::optional<ConnectFailure> verdictOnGreeting(const wire::Frame& frame, const std::string& shown) {
  const auto parsed = parseBinaryPropertyList(frame.body);
  const Dictionary* body = parsed ? parsed.value().asDictionary() : nullptr;
  if (frame.header.kind == wire::FrameKind::refusal && body) {
    const Dictionary* error = body->dictionary(key::kError);
    wire::ReportingError refusal = error ? wire::errorOfDictionary(*error) : wire::ReportingError{};
    if (refusal.description.empty()) {
      refusal.description = filled("The daemon on {} refused the connection and gave no reason.", shown);
    }
    return ConnectFailure{VELTRA_REFUSED, std::move(refusal.description)};
  }
  const auto wire = body ? body->uint32(key::kWire) : std::nullopt;
  if (frame.header.kind != wire::FrameKind::hello || !wire) return notVeltrad(shown);
  if (*wire != wire::kWireVersion) {
    return ConnectFailure{
        VELTRA_REFUSED, filled("The daemon on {} speaks version {} of the wire protocol and this library {}: "
                               "install both from the same release.",
                               shown, *wire, wire::kWireVersion)};
  }
  return std::nullopt;
}

ConnectFailure unansweredGreeting(const std::string& path, std::chrono::milliseconds patience) {
  return noDaemon(
      filled("The daemon on {} gave no answer within {} s: see whether it is stuck or overloaded.",
             escapedForLog(path), seconds(patience)));
}

std::optional<ConnectFailure> verdictOnPath(const std::string& path) {
  const auto address = addressOf(path);
  return address ? std::nullopt : std::optional(address.error());
}

std::string helloFrame() {
  return wire::makeFrame(
      wire::FrameKind::hello, 0,
      Dictionary{{key::kWire, Value(wire::kWireVersion)}, {key::kLibrary, veltra_version()}});
}

Result<FileDescriptor, ConnectFailure> connectAtOnce(const std::string& path) {
  auto connected = connectTo(path, std::chrono::milliseconds(0));
  // From here on each call says itself whether it may wait.
  if (connected) ::fcntl(connected.value().get(), F_SETFL, 0);
  return connected;
}

Received receiveFrame(DaemonSocket& daemon, std::chrono::steady_clock::time_point deadline,
                      wire::Frame& frame) {
  for (;;) {
    switch (daemon.reader.next(frame)) {
      case wire::FrameReader::Next::frame:
        return Received::frame;
      case wire::FrameReader::Next::impossible:
        return Received::impossible;
      case wire::FrameReader::Next::needMore:
        break;
    }
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
    if (left <= 0) return Received::timeout;
    pollfd watched{daemon.socket.get(), POLLIN, 0};
    if (::poll(&watched, 1, static_cast<int>(left)) <= 0) continue;  // the clock decides
    const auto [bytes, room] = daemon.reader.room();
    const ssize_t count = ::recv(daemon.socket.get(), bytes, room, MSG_DONTWAIT);
    if (count > 0) daemon.reader.received(static_cast<std::size_t>(count));
    if (count == 0 || (count < 0 && errno != EAGAIN && errno != EINTR)) return Received::end;
  }
}

Result<DaemonSocket, ConnectFailure> reachDaemon(const std::string& path, const std::string& firstCalls,
                                                 std::chrono::milliseconds patience) {
  const auto deadline = std::chrono::steady_clock::now() + patience;
  auto connected = connectTo(path, patience);
  if (!connected) return Failure{connected.error()};
  DaemonSocket daemon{std::move(connected).value(), {}};
  // A daemon that refuses may end the connection before all is sent; its refusal can still be read.
  (void)sendAll(daemon.socket.get(), helloFrame() + firstCalls);
  const std::string shown = escapedForLog(path);
  wire::Frame frame;
  switch (receiveFrame(daemon, deadline, frame)) {
    case Received::frame:
      break;
    case Received::timeout:
      return Failure{unansweredGreeting(path, patience)};
    case Received::end:
      return Failure{
          noDaemon(filled("The daemon on {} ended the connection without a word: start veltrad "
                          "again, or see its log.",
                          shown))};
    case Received::impossible:
      return Failure{notVeltrad(shown)};
  }
  if (auto failure = verdictOnGreeting(frame, shown)) return Failure{std::move(*failure)};
  return daemon;
}

}  // namespace veltrad::client
