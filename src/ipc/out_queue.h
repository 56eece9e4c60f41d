// What waits to be written to one client. Any thread, but for the operations marked as the connection's own.
#pragma once

#include <atomic>
#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "platform/counters.h"
#include "platform/memory_budget.h"

namespace veltrad::ipc {

// Bytes that wait for one client at most, whether events or replies; a frame of the largest size fits.
inline constexpr std::size_t kOutQueueBound = (1u << 20) + 12;
// What replies may fill beyond it, so that events never cost a client the answer that it waits for.
inline constexpr std::size_t kReplyReserve = 1u << 20;
// Beyond this many waiting bytes the connection takes no further calls until the client has read some
// answers.
inline constexpr std::size_t kOutQueueHighWater = 256u << 10;

// Job: takes frames from any thread, writes them without blocking and in order, and bounds what a slow reader
// costs, in bytes and within what its user may keep. Owns the socket and the wake-up descriptor. Shared by
// the connection and by everybody who may still answer or send, so it may outlive the connection; the
// counters outlive it. Its 14 fields: the descriptors stand here twice, for their owner under the lock and as
// numbers for the connection's thread, which polls without it.
class OutQueue {
 public:
  enum class Sent {
    done,      // written, or waiting for the connection's thread to write it
    full,      // beyond the bound: dropped
    tooLarge,  // one frame beyond the bound of a frame: dropped
    gone,      // the client has closed, or the connection has ended: dropped
  };

  // Without a socket the client is gone from the start. What waits is charged to `account`; null: to nobody.
  OutQueue(FileDescriptor socket, platform::Counters& counters,
           std::shared_ptr<platform::MemoryAccount> account);
  OutQueue(const OutQueue&) = delete;
  OutQueue& operator=(const OutQueue&) = delete;

  // A reply, hello or refusal, which has the reserve too; `full` also ends the connection.
  Sent sendReply(std::string_view frame);
  Sent sendEvent(std::string_view frame);

  // Asks the connection's thread to end the connection as soon as its present call is done.
  void requestEnd();
  bool endRequested() const { return _endRequested.load(std::memory_order_relaxed); }
  // The client can send no further byte; what it sent before can still be read. The connection's thread is
  // woken.
  void stopReading();

  // The connection's own thread.
  // False: the system gave no wake-up descriptor.
  bool usable() const { return _readSocket >= 0 && _readWakeUp >= 0; }
  int socket() const { return _readSocket; }
  int wakeUp() const { return _readWakeUp; }
  // Before it looks for what woke it.
  void drainWakeUp();
  std::size_t waitingBytes() const { return _waitingBytes.load(std::memory_order_relaxed); }
  // Writes what the socket takes now; the number of bytes that still wait.
  std::size_t flush();
  // Ends the conversation: nothing is read or written afterwards. Bytes of the client that nobody read do not
  // destroy what was written to it.
  void close();

 private:
  enum class Kind { event, reply };

  Sent put(std::string_view frame, Kind kind);
  bool charge(std::size_t bytes, Kind kind) REQUIRES(_mutex);
  void payBack(std::size_t waiting) REQUIRES(_mutex);
  bool writeSome(std::string_view& bytes) REQUIRES(_mutex);
  void giveUp() REQUIRES(_mutex);
  void wake() REQUIRES(_mutex);

  // Constant after construction; the connection's own thread alone may use the numbers, until its close().
  platform::Counters& _counters;
  const std::shared_ptr<platform::MemoryAccount> _account;
  const int _readSocket;
  const int _readWakeUp;

  std::atomic<bool> _endRequested{false};
  // Written under the lock; a hint for the connection's thread, which is woken after it rose from zero.
  std::atomic<std::size_t> _waitingBytes{0};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  FileDescriptor _socket GUARDED_BY(_mutex);
  FileDescriptor _wakeUp GUARDED_BY(_mutex);
  bool _gone GUARDED_BY(_mutex) = false;
  std::string _waiting GUARDED_BY(_mutex);
  platform::Charge _events GUARDED_BY(_mutex);   // kept: nobody need ever read them
  platform::Charge _replies GUARDED_BY(_mutex);  // working: their calls are waited for
  std::size_t _written GUARDED_BY(_mutex) = 0;   // of _waiting
};

// Shuts a socket down and closes it so that the peer can still read what was written to it.
void closeGently(FileDescriptor socket);

}  // namespace veltrad::ipc
