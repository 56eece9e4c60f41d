// SPDX-License-Identifier: Apache-2.0
// The connection of a session to the daemon. Any thread may make calls; callbacks run on the connection's own
// thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <thread>

#include "base/mutex.h"
#include "base/thread.h"
#include "client/answer.h"
#include "client/answer_reader.h"
#include "client/call_table.h"
#include "client/calls.h"
#include "client/daemon_socket.h"
#include "client/exchange.h"
#include "client/fork_mark.h"
#include "client/reader_role.h"
#include "client/socket_watch.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// Sends calls to the daemon in order, ends each exactly once, and reconnects when the connection has ended.
//
// Its thread connects, reads if no waiting thread does (ReaderRole), and runs callbacks, without a lock. It
// is started by the first call that needs it. The Exchange holds what is to be sent and what was received;
// this class adds the threads and the lock.
//
// After close() no other call may start. Waiting threads share the ownership, because they may still use the
// object after their answer has arrived. In a forked child only forked() and abandon() may be called.
class DaemonConnection {
 public:
  // `connected` is a connection on which the description was sent, or absent: then the thread connects. Null
  // if there are no descriptors or no thread; `error` says which.
  static std::shared_ptr<DaemonConnection> make(ConnectionOptions options,
                                                const std::optional<SessionChange>& description,
                                                std::optional<DaemonSocket> connected, std::string& error);
  ~DaemonConnection();

  // In the call's frame, the call ID is 0. Without a callback and a file, the caller gets no answer.
  veltra_status send(OutCall call, veltra_callback callback, void* context);
  // The caller must settle the answer (settleUpload).
  Answer sendAndWait(OutCall call);
  bool onOwnThread() const {
    return _ownThread.load(std::memory_order_relaxed) == std::this_thread::get_id();
  }
  veltra_statistics statistics();
  std::uint64_t counter(veltra_counter which);
  // See veltra_session_close. Returns the number of lost calls that no counter has reported yet.
  std::uint64_t close();

  // The process is a forked child of the one that the session belongs to.
  bool forked() const { return _process.forked(); }
  // In a forked child: closes its descriptors, and frees what no thread of the parent was using at the time
  // of the fork. The connection itself is the parent's.
  static void abandon(std::shared_ptr<DaemonConnection> connection);

 private:
  using Clock = Reconnection::Clock;
  using Phase = Exchange::Phase;
  enum class Stopping { no, draining, ending };
  // The next step of a waiting thread: whether it reads, and from which socket.
  struct Turn {
    bool reads;
    int socket = -1;
    bool writing = false;
  };

  DaemonConnection(ConnectionOptions options, const std::optional<SessionChange>& description,
                   bool connected);

  // Called on the connection's thread.
  void run() EXCLUDES(_lock);
  void connectIfDue() EXCLUDES(_lock);
  void serve(std::uint32_t events) EXCLUDES(_lock);
  int socketToRead(std::uint32_t events) EXCLUDES(_lock);
  int millisecondsToNextStep() EXCLUDES(_lock);
  bool runReady() EXCLUDES(_lock);

  // Called by a waiting thread.
  Turn waitForTurn(Waiter& waiter, Clock::time_point deadline) EXCLUDES(_lock);
  void readUntilAnswered(const Waiter& waiter, Turn turn) EXCLUDES(_lock);

  bool startThread() REQUIRES(_lock);
  void handle(AnswerReader::Got got) REQUIRES(_lock);
  void passOnReading() REQUIRES(_lock);
  void updateWatch() REQUIRES(_lock);
  std::uint32_t wantedEvents() REQUIRES(_lock);
  void joinThread() NO_THREAD_SAFETY_ANALYSIS;
  void closeCopies() NO_THREAD_SAFETY_ANALYSIS;
  bool mayFree() EXCLUDES(_lock);

  // Constant after construction.
  const ConnectionOptions _options;
  const ForkMark _process;
  std::atomic<std::thread::id> _ownThread{};

  // Used only by the thread that holds the role.
  AnswerReader _reader;

  Mutex _lock LEAF_LOCK{LockRank::leaf};
  Condition _progress;  // of close()
  // The events for which the thread waits; only the wait itself is done without the lock.
  SocketWatch _watch;
  Thread _thread GUARDED_BY(_lock);
  ReaderRole _role GUARDED_BY(_lock);
  Exchange _exchange GUARDED_BY(_lock);
  // The daemon has ended the connection; what it sent before may still be unread.
  bool _hungUp GUARDED_BY(_lock) = false;
  Stopping _stopping GUARDED_BY(_lock) = Stopping::no;
};

}  // namespace veltrad::client
