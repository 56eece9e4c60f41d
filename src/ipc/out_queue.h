// SPDX-License-Identifier: Apache-2.0
// The frames that wait to be written to one client.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/mutex.h"
#include "ipc/sent_frame.h"
#include "platform/counters.h"
#include "platform/memory_budget.h"

namespace veltrad::ipc {

// The bytes of events that may wait for one client; a frame of the largest size fits.
inline constexpr std::size_t kOutQueueBound = (1u << 20) + 12;
// The bytes by which replies may exceed this, so that events never displace them.
inline constexpr std::size_t kReplyReserve = 1u << 20;
// If more bytes wait, the connection runs no further calls until the client has read some.
inline constexpr std::size_t kOutQueueHighWater = 256u << 10;

// Takes frames from any thread, writes them in order without blocking, and limits the memory for a client
// that does not read. Owns the socket and the wake-up descriptor. Shared by the connection and by everything
// that may still answer, so it may outlive the connection; the counters must outlive it. Its 17 fields hold
// the descriptors twice: as owners under the lock, and as numbers for the connection's thread, which polls
// without it.
class OutQueue {
 public:
  // done: written, or waiting to be written. The frame was dropped for the others. full: too many bytes wait.
  // tooLarge: the frame is beyond the limit of a frame. gone: the client or the connection has ended.
  enum class Sent { done, full, tooLarge, gone };

  // `account` may be null.
  OutQueue(FileDescriptor socket, platform::Counters& counters,
           std::shared_ptr<platform::MemoryAccount> account);

  // For replies, hellos and refusals, which may use the reserve. `full` also ends the connection.
  Sent sendReply(std::string_view frame);
  // The same for the reply to a message, without a text. May throw std::bad_alloc.
  Sent sendOutcomes(std::uint32_t callID, const wire::Outcomes& outcomes);
  Sent sendEvent(std::string_view frame);
  // For the last frame, which may use the reserve too. A client that has gone is not counted.
  void sendLast(std::string_view frame) { put(frame, Kind::reply); }

  // Asks the connection's thread to end the connection after its current call.
  void requestEnd();
  bool endRequested() const { return _endRequested.load(std::memory_order_relaxed); }
  // Wakes the connection's thread.
  void wakeReader();
  // The client cannot send any more; what it sent before can still be read. Wakes the connection's thread.
  void stopReading();

  // The following are for the connection's own thread.

  // False if there was no wake-up descriptor.
  bool usable() const { return _readSocket >= 0 && _readWakeUp >= 0; }
  int socket() const { return _readSocket; }
  int wakeUp() const { return _readWakeUp; }
  void drainWakeUp();
  std::size_t waitingBytes() const { return _waitingBytes.load(std::memory_order_relaxed); }
  // Until flush(), frames wait so that several are written in one call. To be used only while the thread does
  // not block.
  void hold();
  // Writes as much as possible, and returns the number of bytes that still wait.
  std::size_t flush();
  // Closes the socket so that the client can still read what was written to it.
  void close();

 private:
  enum class Kind { event, reply };

  Sent put(std::string_view frame, Kind kind);
  Sent putLocked(std::string_view frame, Kind kind) REQUIRES(_mutex);
  Sent counted(Sent sent);
  bool charge(std::size_t bytes, Kind kind) REQUIRES(_mutex);
  void payBack(std::size_t waiting) REQUIRES(_mutex);
  bool writeSome(std::string_view& bytes) REQUIRES(_mutex);
  void giveUp() REQUIRES(_mutex);
  void wake() REQUIRES(_mutex);

  // Constant after construction. Only the connection's own thread may use the numbers, until it calls
  // close().
  platform::Counters& _counters;
  const std::shared_ptr<platform::MemoryAccount> _account;
  const int _readSocket;
  const int _readWakeUp;

  // Used only by the connection's own thread: whether it has called hold().
  bool _holds = false;

  std::atomic<bool> _endRequested{false};
  // Written under the lock; read by the connection's thread, which is woken when it rises from zero.
  std::atomic<std::size_t> _waitingBytes{0};

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  FileDescriptor _socket GUARDED_BY(_mutex);
  FileDescriptor _wakeUp GUARDED_BY(_mutex);
  bool _gone GUARDED_BY(_mutex) = false;
  bool _held GUARDED_BY(_mutex) = false;
  std::string _waiting GUARDED_BY(_mutex);
  // Events are charged as kept, replies as working memory.
  platform::Charge _events GUARDED_BY(_mutex);
  platform::Charge _replies GUARDED_BY(_mutex);
  // Bytes of _waiting that were written.
  std::size_t _written GUARDED_BY(_mutex) = 0;
  SentFrame _lastSent GUARDED_BY(_mutex);
};

// Closes a socket so that the peer can still read what was written to it.
void closeGently(FileDescriptor socket);

}  // namespace veltrad::ipc
