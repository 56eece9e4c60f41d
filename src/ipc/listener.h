// SPDX-License-Identifier: Apache-2.0
// Accepts clients, gives each connection its own thread, and joins the threads that have ended.
#pragma once

#include <chrono>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "base/thread.h"
#include "ipc/connection.h"
#include "ipc/entitlements.h"
#include "ipc/service_socket.h"
#include "platform/counters.h"
#include "platform/lent_files.h"
#include "platform/memory_budget.h"
#include "wire/constants.h"

namespace veltrad::ipc {

class SocketConnection;

struct ListenerOptions {
  ServiceSocket socket;
  Entitlements& entitlements;
  platform::LentFiles& lentFiles;
  platform::Counters& counters;
  platform::MemoryBudget& memory;
  // For the text of a refusal.
  std::string entitlementsPath;
  std::size_t mostConnections = 4096;
  std::size_t mostConnectionsOfOneUser = 1024;
  // The number of these that are reserved for root and the daemon's own user.
  std::size_t connectionsForOwner = 0;
  // The entitlement that a peer needs for a connection; if empty, the delegate checks each call.
  std::string entitlement = wire::kVeltraEntitlement;
};

// Makes a Connection for every client, which the delegate accepts or refuses on the connection's own thread.
// A refused client gets a refusal frame that says why. The delegate and what the options refer to must
// outlive it. resume() and invalidate() are called by the thread that made it, never by a connection's
// thread.
//
// Its 13 fields are the options, the data for accepting, and the connections that it must end when it stops.
class Listener {
 public:
  Listener(ListenerOptions options, ListenerDelegate& delegate);
  // Invalidates, and waits for every thread without a time limit.
  ~Listener();

  // Starts the accepting thread. False if there is no thread or descriptor, which is logged.
  bool resume();

  // Closes the listening socket (and removes its file if this process made it), reads nothing more from
  // clients, runs the frames that have arrived completely, invalidates every connection and joins all
  // threads. Calls that have not begun by `deadline` are dropped. Returns the number of connections whose
  // call is still running then; the destructor joins their threads. May be called again.
  std::size_t invalidate(std::chrono::steady_clock::time_point deadline);

  // Any thread.
  std::size_t connectionCount();
  std::size_t mostConnections() const { return _options.mostConnections; }

 private:
  struct Client {
    std::shared_ptr<SocketConnection> connection;
    Thread thread;
    unsigned uid = 0;
  };

  void acceptLoop();
  struct Arrived {
    FileDescriptor socket;
    // Only its credentials are known.
    Peer peer;
    // Empty if the credentials do not suffice for a refusal.
    std::string refusal;
  };
  void acceptSome();
  bool acceptOne(std::vector<Arrived>& arrived);
  void acceptWithSpare(int error);
  std::string refusalOf(const Peer& peer);
  void pause(int error);
  void warnOfAccept(int error);
  void admit(FileDescriptor socket);
  std::optional<std::string> boundReached(unsigned uid);
  bool startClient(std::uint64_t number, unsigned uid, const std::shared_ptr<SocketConnection>& connection);
  void reap();
  void wake();
  void runConnection(std::uint64_t number, SocketConnection& connection);
  void serve(SocketConnection& connection);
  void forgetUser(unsigned uid) REQUIRES(_mutex);

  // Constant after construction, except for the socket, which is closed when the accepting thread has ended.
  ListenerOptions _options;
  ListenerDelegate& _delegate;
  const FileDescriptor _wakeUp;

  // Used by the accepting thread while it runs, else by the owner.
  FileDescriptor _spare;
  std::chrono::steady_clock::time_point _lastWarning{};
  std::uint64_t _nextNumber = 1;

  // Used by the owner.
  Thread _acceptThread;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  bool _stopping GUARDED_BY(_mutex) = false;
  std::map<std::uint64_t, Client> _clients GUARDED_BY(_mutex);
  // Clients whose threads have ended and must be joined.
  std::map<std::uint64_t, Client> _finished GUARDED_BY(_mutex);
  std::map<unsigned, std::size_t> _clientsOfUser GUARDED_BY(_mutex);
};

}  // namespace veltrad::ipc
