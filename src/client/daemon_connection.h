// The client's end of a connection: calls out, answers and events in. Any thread; callbacks on its own
// thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "base/thread.h"
#include "base/value.h"
#include "client/answer.h"
#include "client/call_table.h"
#include "client/daemon_socket.h"
#include "client/out_frames.h"
#include "veltra/veltra.h"
#include "wire/frame.h"

namespace veltrad::client {

// Job: carries calls to the daemon in the order in which they were made and ends each exactly once.
//
// Whoever holds the reading role reads the socket, alone: a thread that waits for its own answer takes the
// role when it is free, which makes such a call as fast as a bare exchange on the socket; otherwise the
// connection's thread does. Both hand each answer to the thread that waits for it, or into the queue of
// callbacks, which the connection's thread alone runs, under no lock.
//
// Its 18 fields are the descriptors that its thread sleeps on and what epoll knows of them, who reads and
// what that has brought, the frames out and the calls under way: who reads and what is watched follow from
// what waits, so that all of it changes under one lock.
//
// close() ends it; no other call may start after that. Threads that wait hold a share of it, since they leave
// after their answer is there.
class DaemonConnection {
 public:
  // Gets an event's body on the connection's thread.
  using EventHandler = std::function<void(const Dictionary&)>;

  // Null when the system gives no descriptors or no thread; `error` says which. Without a handler events that
  // are not about an upload are dropped.
  static std::shared_ptr<DaemonConnection> make(DaemonSocket daemon, std::size_t queueBytes,
                                                EventHandler handler, std::string& error);
  ~DaemonConnection();
  DaemonConnection(const DaemonConnection&) = delete;
  DaemonConnection& operator=(const DaemonConnection&) = delete;

  using File = std::shared_ptr<UploadedFile>;

  // `frame` is a call's, its call id still 0. Without a callback no answer is asked for, unless there is a
  // file that the answer is about.
  veltra_status send(std::string frame, veltra_callback callback, void* context, File file = nullptr);
  // The answer is still to be settled (settleUpload), on the caller's thread.
  Answer sendAndWait(std::string frame, File file = nullptr);
  bool onOwnThread() const {
    return _ownThread.load(std::memory_order_relaxed) == std::this_thread::get_id();
  }
  veltra_statistics statistics();
  // See veltra_session_close. Returns how many calls were accepted but never written.
  std::uint64_t close();

 private:
  enum class Reader { nobody, waiter, ownThread };
  enum class Received { something, nothing, end };

  // What came in with one read; an event when `callID` is 0.
  struct Arrived {
    std::uint32_t callID = 0;
    Answer answer;
    Dictionary event;
  };

  DaemonConnection(DaemonSocket daemon, std::size_t queueBytes, EventHandler handler);

  // The connection's thread.
  void run();
  void serve(std::uint32_t events) EXCLUDES(_lock);
  bool runReady() EXCLUDES(_lock);

  // The holder of the reading role, without the lock.
  Received receive(int flags);
  bool takeFrames();  // false when nothing sensible can follow
  void waitForSocket(short events, int milliseconds = -1);

  veltra_status enqueue(std::string frame, CallTable::Call call) REQUIRES(_lock);
  void readAsWaiter(const Waiter& waiter) REQUIRES(_lock);
  void readAsOwnThread() REQUIRES(_lock);
  void deliver() REQUIRES(_lock);
  void passOnReading() REQUIRES(_lock);
  void writeWaiting() REQUIRES(_lock);
  void end() REQUIRES(_lock);
  void updateInterest() REQUIRES(_lock);
  void unwatch() REQUIRES(_lock);
  void wake();

  // Constant after construction.
  const FileDescriptor _socket;
  FileDescriptor _epoll;
  FileDescriptor _wakeUp;
  const EventHandler _handler;
  Thread _thread;
  std::atomic<std::thread::id> _ownThread{};

  // The holder of the reading role only.
  wire::FrameReader _frames;
  std::vector<Arrived> _arrived;

  Mutex _lock LEAF_LOCK{LockRank::leaf};
  Reader _reader GUARDED_BY(_lock) = Reader::ownThread;  // which first takes what came behind the hello
  std::vector<Waiter*> _parked GUARDED_BY(_lock);        // wait while another reads
  OutFrames _out GUARDED_BY(_lock);
  CallTable _calls GUARDED_BY(_lock);
  std::uint32_t _interest GUARDED_BY(_lock) = 0;  // what epoll was last told
  bool _watched GUARDED_BY(_lock) = true;
  bool _hungUp GUARDED_BY(_lock) = false;  // the daemon has ended; what it sent before may still be unread
  bool _ended GUARDED_BY(_lock) = false;
  bool _stopping GUARDED_BY(_lock) = false;  // the thread ends once nothing is ready
};

}  // namespace veltrad::client
