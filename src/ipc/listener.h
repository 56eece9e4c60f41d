// The front door: accepts clients, gives each connection a thread of its own and reaps the threads that
// ended.
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
  std::string entitlementsPath;  // platform::Root::entitlementsPath(), for the text of a refusal
  std::size_t mostConnections = 4096;
  std::size_t mostConnectionsOfOneUser = 1024;
  // Of them, those that root and the daemon's own user alone may have.
  std::size_t connectionsForOwner = 0;
  // What a peer must hold to get a connection; empty: the delegate asks at each call.
  std::string entitlement = wire::kVeltraEntitlement;
};

// Job: every client that connects gets a Connection, on which the delegate decides on that connection's own
// thread; a refused one gets a refusal frame that says why. The delegate, the entitlements, the lent files
// and the counters outlive it. resume() and invalidate() belong to the thread that made it, which is never a
// connection's own.
//
// Its 22 fields are what each connection is given and the bounds, what accepting needs, and the connections
// that it must find again when it stops.
class Listener {
 public:
  Listener(ListenerOptions options, ListenerDelegate& delegate);
  // Invalidates first if nobody did, and waits for every thread without a bound.
  ~Listener();
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  // Starts the accepting thread, once. False when no thread could be had; the reason is logged.
  bool resume();

  // Stops: closes the listening socket (and removes its file if this process made it), takes no more bytes
  // from any client, runs the frames that had arrived whole, invalidates every connection and joins all
  // threads. Waits until `deadline` at most: then calls that wait for their turn are given up, and the answer
  // is the number of connections whose call is still running; their threads are joined by the destructor.
  // Twice does nothing new.
  std::size_t invalidate(std::chrono::steady_clock::time_point deadline);

  // Any thread.
  std::size_t connectionCount();
  std::size_t mostConnections() const { return _mostConnections; }

 private:
  struct Client {
    std::shared_ptr<SocketConnection> connection;
    Thread thread;
    unsigned uid = 0;
  };

  void acceptLoop();
  struct Arrived {
    FileDescriptor socket;
    Peer peer;            // credentials alone
    std::string refusal;  // empty: none that its user id tells
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
  void forget(std::uint64_t number) REQUIRES(_mutex);

  // Constant after construction.
  ListenerDelegate& _delegate;
  Entitlements& _entitlements;
  platform::LentFiles& _lentFiles;
  platform::Counters& _counters;
  platform::MemoryBudget& _memory;
  const std::string _entitlementsPath;
  const std::size_t _mostConnections;
  const std::size_t _mostConnectionsOfOneUser;
  const std::size_t _connectionsForOwner;
  const std::string _entitlement;
  const FileDescriptor _wakeUp;

  // The accepting thread's while it runs, else the owner's.
  ServiceSocket _socket;
  FileDescriptor _spare;
  std::chrono::steady_clock::time_point _lastWarning{};
  std::uint64_t _nextNumber = 1;

  // The owner's.
  Thread _acceptThread;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  bool _stopping GUARDED_BY(_mutex) = false;
  std::map<std::uint64_t, Client> _clients GUARDED_BY(_mutex);
  std::map<unsigned, std::size_t> _clientsOfUser GUARDED_BY(_mutex);
  std::vector<Thread> _finished GUARDED_BY(_mutex);
};

}  // namespace veltrad::ipc
