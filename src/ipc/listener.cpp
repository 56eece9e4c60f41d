// SPDX-License-Identifier: Apache-2.0
// Accepts and limits connections, and joins the threads that have ended.
#include "ipc/listener.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <new>

#include "ipc/out_queue.h"
#include "ipc/peer.h"
#include "ipc/socket_connection.h"
#include "platform/log.h"

namespace veltrad::ipc {

namespace {

// The pause of the accepting thread when the system has no descriptor or memory left.
constexpr int kPauseMilliseconds = 100;
// The number of clients that are accepted before any of them is handled.
constexpr std::size_t kMostAtOnce = 64;

// A copy of descriptor 0, which is always open, because the sandbox allows no path for this.
FileDescriptor openSpare() {
  return FileDescriptor(::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 0));
}

std::string refusedPeer(const Peer& peer, const std::string& unit, const std::string& entitlementsPath) {
  return fmt::format(
      "Connection refused: this peer (uid {}, gid {}, unit {}) does not hold the entitlement \"{}\"; add a "
      "rule for it "
      "to {}.",
      peer.uid, peer.gids.empty() ? std::string("unknown") : std::to_string(peer.gids.front()), unit,
      wire::kVeltraEntitlement, entitlementsPath);
}

// Tells the peer why it is refused. Its queue is empty, so this does not block.
void refuseSocket(FileDescriptor socket, const std::string& description) {
  const std::string frame = refusalFrame(description);
  ::send(socket.get(), frame.data(), frame.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
  closeGently(std::move(socket));
}

}  // namespace

Listener::Listener(ListenerOptions options, ListenerDelegate& delegate)
    : _options(std::move(options)),
      _delegate(delegate),
      _wakeUp(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)),
      _spare(openSpare()) {}

Listener::~Listener() {
  invalidate(std::chrono::steady_clock::now());
  {
    Lock lock(_mutex);
    while (!_clients.empty()) _changed.wait(_mutex);
  }
  reap();
}

bool Listener::resume() {
  if (!_wakeUp.isOpen() || !_acceptThread.start("accept", kConnectionStackBytes, [this] { acceptLoop(); })) {
    logError("listener: No thread or descriptor for accepting connections");
    return false;
  }
  return true;
}

std::size_t Listener::invalidate(std::chrono::steady_clock::time_point deadline) {
  {
    Lock lock(_mutex);
    _stopping = true;
  }
  wake();
  _acceptThread.join();
  _options.socket.close();
  std::vector<std::shared_ptr<SocketConnection>> connections;
  {
    Lock lock(_mutex);
    for (const auto& [number, client] : _clients) connections.push_back(client.connection);
  }
  for (const auto& connection : connections) connection->stop(deadline);
  connections.clear();
  std::size_t left = 0;
  {
    Lock lock(_mutex);
    while (!_clients.empty() && _changed.waitUntil(_mutex, deadline)) {
    }
    left = _clients.size();
  }
  reap();
  return left;
}

void Listener::wake() {
  ::eventfd_write(_wakeUp.get(), 1);
}

// The accepting thread, from here to reap().
void Listener::acceptLoop() {
  while (true) {
    pollfd watched[] = {{_options.socket.listening(), POLLIN, 0}, {_wakeUp.get(), POLLIN, 0}};
    ::poll(watched, 2, -1);
    if (watched[1].revents != 0) {
      eventfd_t count = 0;
      ::eventfd_read(_wakeUp.get(), &count);
      reap();
      Lock lock(_mutex);
      if (_stopping) return;
    }
    if (watched[0].revents == 0) continue;
    try {
      acceptSome();
    } catch (const std::bad_alloc&) {
      pause(ENOMEM);
    }
  }
}

// Clients that are refused by their user ID are handled last, so that a user who connects again and again
// does not delay others.
void Listener::acceptSome() {
  std::vector<Arrived> arrived;
  arrived.reserve(kMostAtOnce);
  pollfd watched{_options.socket.listening(), POLLIN, 0};
  do {
    if (!acceptOne(arrived)) break;
  } while (arrived.size() < kMostAtOnce && ::poll(&watched, 1, 0) > 0);
  for (Arrived& one : arrived) {
    if (one.refusal.empty()) admit(std::move(one.socket));
  }
  for (Arrived& one : arrived) {
    if (one.socket.isOpen()) refuseSocket(std::move(one.socket), one.refusal);
  }
}

// False if no more clients are waiting or can be accepted.
bool Listener::acceptOne(std::vector<Arrived>& arrived) {
  FileDescriptor socket(::accept4(_options.socket.listening(), nullptr, nullptr, SOCK_CLOEXEC));
  if (socket.isOpen()) {
    auto peer = credentialsOfSocket(socket.get());
    std::string refusal = peer ? refusalOf(peer.value()) : std::string();
    arrived.push_back({std::move(socket), peer ? std::move(peer.value()) : Peer{}, std::move(refusal)});
    return true;
  }
  switch (errno) {
    case EAGAIN:
    case EINTR:
    case ECONNABORTED:
      return false;
    case EMFILE:
    case ENFILE:
      acceptWithSpare(errno);
      return false;
    default:
      pause(errno);
      return false;
  }
}

// Decides by the credentials only; empty if they do not suffice for a refusal.
std::string Listener::refusalOf(const Peer& peer) {
  if (auto bound = boundReached(peer.uid)) return std::move(*bound);
  if (_options.entitlement.empty() || _options.entitlements.mayHold(_options.entitlement, peer.uid))
    return {};
  _options.counters.count(wire::Reason::not_entitled);
  logDebug(
      "listener: new Vopex connection %s does not have required veltra entitlement. Closing connection...",
      SocketConnection::describe(_nextNumber++, peer).c_str());
  return refusedPeer(peer, "not looked up", _options.entitlementsPath);
}

// No descriptor is left. The spare one is used to accept and refuse this client, so that the queue moves on.
void Listener::acceptWithSpare(int error) {
  warnOfAccept(error);
  _options.counters.count(wire::Reason::no_descriptor);
  _spare.reset();
  FileDescriptor socket(::accept4(_options.socket.listening(), nullptr, nullptr, SOCK_CLOEXEC));
  if (socket.isOpen()) {
    refuseSocket(std::move(socket),
                 "Connection refused: the daemon has no descriptor left; try again later.");
  }
  _spare = openSpare();
  if (!_spare.isOpen()) pause(error);
}

// Waits, because an immediate attempt would fail again.
void Listener::pause(int error) {
  warnOfAccept(error);
  pollfd watched{_wakeUp.get(), POLLIN, 0};
  ::poll(&watched, 1, kPauseMilliseconds);
}

void Listener::warnOfAccept(int error) {
  const auto now = std::chrono::steady_clock::now();
  if (now - _lastWarning < std::chrono::seconds(1)) return;
  _lastWarning = now;
  logWarning("listener: A connection could not be accepted: %s", std::strerror(error));
}

void Listener::admit(FileDescriptor socket) {
  auto peer = peerOfSocket(socket.get());
  if (!peer) {
    _options.counters.count(wire::Reason::peer_unknown);
    return refuseSocket(std::move(socket),
                        "Connection refused: the kernel does not say who you are: " + peer.error());
  }
  const unsigned uid = peer.value().uid;
  if (const auto bound = boundReached(uid)) return refuseSocket(std::move(socket), *bound);
  const std::uint64_t number = _nextNumber++;
  auto connection = std::make_shared<SocketConnection>(number, std::move(socket), std::move(peer.value()),
                                                       _options.entitlements, _options.lentFiles,
                                                       _options.counters, _options.memory.accountOf(uid));
  if (connection->usable() && startClient(number, uid, connection)) return;
  _options.counters.count(wire::Reason::no_thread);
  connection->refuse("Connection refused: the daemon has no thread or descriptor left; try again later.");
  warnOfAccept(EAGAIN);
}

std::optional<std::string> Listener::boundReached(unsigned uid) {
  bool all = false;
  {
    Lock lock(_mutex);
    all = _clients.size() >= _options.mostConnections - (isOwner(uid) ? 0 : _options.connectionsForOwner);
    const auto mine = _clientsOfUser.find(uid);
    if (!all && (mine == _clientsOfUser.end() || mine->second < _options.mostConnectionsOfOneUser))
      return std::nullopt;
  }
  if (all) {
    _options.counters.count(wire::Reason::too_many_connections);
    return fmt::format("Connection refused: {} connections are open, and no more are taken.",
                       _options.mostConnections - _options.connectionsForOwner);
  }
  _options.counters.count(wire::Reason::too_many_of_user);
  return fmt::format("Connection refused: uid {} has {} connections open, and no more are taken of one user.",
                     uid, _options.mostConnectionsOfOneUser);
}

bool Listener::startClient(std::uint64_t number, unsigned uid,
                           const std::shared_ptr<SocketConnection>& connection) {
  // The thread takes the lock before it uses its entry, which is then complete.
  Lock lock(_mutex);
  ++_clientsOfUser[uid];
  bool started = false;
  try {
    Client& client = _clients[number];
    client.connection = connection;
    client.uid = uid;
    started = client.thread.start("connection", kConnectionStackBytes,
                                  [this, number, connection] { runConnection(number, *connection); });
  } catch (const std::bad_alloc&) {  // as without a thread
  }
  if (!started) {
    _clients.erase(number);
    forgetUser(uid);
  }
  return started;
}

std::size_t Listener::connectionCount() {
  Lock lock(_mutex);
  return _clients.size();
}

void Listener::reap() {
  std::map<std::uint64_t, Client> finished;
  {
    Lock lock(_mutex);
    finished.swap(_finished);
  }
  for (auto& [number, client] : finished) client.thread.join();
}

// The connection's own thread, from here on.
void Listener::runConnection(std::uint64_t number, SocketConnection& connection) {
  try {
    serve(connection);
  } catch (const std::bad_alloc&) {  // it ends with the connection
    _options.counters.count(wire::Reason::call_out_of_memory);
  }
  Lock lock(_mutex);
  // A node moves without memory.
  _finished.insert(_clients.extract(number)).position->second.connection.reset();
  forgetUser(connection.peer().uid);
  _changed.notifyAll();
  wake();
}

void Listener::serve(SocketConnection& connection) {
  if (_delegate.listener(*this, connection.shared_from_this())) {
    connection.run();
  } else {
    _options.counters.count(wire::Reason::not_entitled);
    connection.refuse(
        refusedPeer(connection.peer(), connection.peer().unit.value_or("none"), _options.entitlementsPath));
  }
}

void Listener::forgetUser(unsigned uid) {
  const auto count = _clientsOfUser.find(uid);
  if (--count->second == 0) _clientsOfUser.erase(count);
}

}  // namespace veltrad::ipc
