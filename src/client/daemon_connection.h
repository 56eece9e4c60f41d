// SPDX-License-Identifier: Apache-2.0
// The client's end of a connection to the daemon. Any thread may make calls; callbacks run on its own thread.
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

// Sends calls to the daemon in the order in which they were made, and ends each exactly once.
//
// One thread at a time reads the socket. A thread that waits for its own answer becomes the reader if there
// is none, which makes such a call as fast as an exchange on the bare socket; otherwise the connection's
// thread reads. The reader passes each answer to the thread that waits for it, or into the queue of
// callbacks. Only the connection's thread runs callbacks, without holding a lock.
//
// Its 18 fields are the descriptors that its thread waits for and their state in epoll, the reader and what
// it has read, the frames to be written and the open calls. They depend on each other, so one lock guards
// them all.
//
// After close() no other call may start. Waiting threads share the ownership, because they may still use the
// object after their answer has arrived.
class DaemonConnection {
 public:
  // Gets an event's body on the connection's thread.
  using EventHandler = std::function<void(const Dictionary&)>;

  // Null if there are no descriptors or no thread; `error` says which. Without a handler, all events but
  // those about uploads are dropped.
  static std::shared_ptr<DaemonConnection> make(DaemonSocket daemon, std::size_t queueBytes,
                                                EventHandler handler, std::string& error);
  ~DaemonConnection();

  using File = std::shared_ptr<UploadedFile>;

  // `frame` is a call with the call ID 0. Without a callback and a file, no answer is asked for.
  veltra_status send(std::string frame, veltra_callback callback, void* context, File file = nullptr);
  // The caller must settle the answer (settleUpload).
  Answer sendAndWait(std::string frame, File file = nullptr);
  bool onOwnThread() const {
    return _ownThread.load(std::memory_order_relaxed) == std::this_thread::get_id();
  }
  veltra_statistics statistics();
  // See veltra_session_close. Returns the number of calls that were accepted but never written.
  std::uint64_t close();

 private:
  enum class Reader { nobody, waiter, ownThread };
  enum class Received { something, nothing, end };

  // An answer or, if `callID` is 0, an event.
  struct Arrived {
    std::uint32_t callID = 0;
    Answer answer;
    Dictionary event;
  };

  DaemonConnection(DaemonSocket daemon, std::size_t queueBytes, EventHandler handler);

  // Called on the connection's thread.
  void run();
  void serve(std::uint32_t events) EXCLUDES(_lock);
  bool runReady() EXCLUDES(_lock);

  // Called by the reader, without the lock. takeFrames() returns false if the connection must end.
  Received receive(int flags);
  bool takeFrames();
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

  // Used only by the reader.
  wire::FrameReader _frames;
  std::vector<Arrived> _arrived;

  Mutex _lock LEAF_LOCK{LockRank::leaf};
  // At first the connection's thread, which handles what followed the hello.
  Reader _reader GUARDED_BY(_lock) = Reader::ownThread;
  // Threads that wait while another one reads.
  std::vector<Waiter*> _parked GUARDED_BY(_lock);
  OutFrames _out GUARDED_BY(_lock);
  CallTable _calls GUARDED_BY(_lock);
  // The events that epoll reports of the socket, and whether it reports any.
  std::uint32_t _interest GUARDED_BY(_lock) = 0;
  bool _watched GUARDED_BY(_lock) = true;
  // The daemon has ended the connection; what it sent before may still be unread.
  bool _hungUp GUARDED_BY(_lock) = false;
  bool _ended GUARDED_BY(_lock) = false;
  // The thread ends as soon as nothing is ready.
  bool _stopping GUARDED_BY(_lock) = false;
};

}  // namespace veltrad::client
