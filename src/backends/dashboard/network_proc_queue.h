// What a dashboard back end does on the network: its socket, its waiting datagrams, its timer. Any thread;
// ticks and acknowledgements come on the work pool.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string_view>

#include "backends/dashboard/delivery_schedule.h"
#include "backends/dashboard/message_queue.h"
#include "base/mutex.h"
#include "platform/pool_timer.h"
#include "platform/read_source.h"
#include "platform/udp_socket.h"

namespace veltrad {

namespace platform {
class Counters;
class WorkPool;
}  // namespace platform

// A serial queue: one thing at a time, in the order in which it came, on the thread that brings it; a first
// transmission never blocks and costs no change of thread. The armed timer keeps it alive after its back end
// until nothing waits or the last resort; the socket is closed then, or with the object, once. `counters`
// must outlive it.
class NetworkProcQueue final : public std::enable_shared_from_this<NetworkProcQueue> {
 public:
  // `socket` is connected.
  NetworkProcQueue(platform::UDPSocket socket, std::unique_ptr<platform::PoolTimer> timer, bool reliableUDP,
                   std::chrono::milliseconds period, platform::Counters& counters);
  // Counts the datagrams that still wait as lost.
  ~NetworkProcQueue();

  // Acknowledgements are read from now on; false: they cannot be.
  bool startReading(platform::WorkPool& pool);
  void tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber);
  // Stops at once when nothing waits, else when nothing waits any more, 9.5 s after the next tick at the
  // latest.
  void cleanup();

 private:
  void timerFired();
  void myPeriodicTask(DeliverySchedule::Time now) REQUIRES(_mutex);
  void armTimer(DeliverySchedule::Time now) REQUIRES(_mutex);
  void awaitReading() REQUIRES(_mutex);
  void readable();
  bool processSocketRead() REQUIRES(_mutex);
  void cleanupSources() REQUIRES(_mutex);

  // Constant after construction.
  platform::Counters& _counters;

  Mutex _mutex BACKEND_LOCK{LockRank::backend};
  platform::UDPSocket _socket GUARDED_BY(_mutex);
  MessageQueue _messageQueue GUARDED_BY(_mutex);
  DeliverySchedule _schedule GUARDED_BY(_mutex);
  std::unique_ptr<platform::PoolTimer> _timer GUARDED_BY(_mutex);  // null: stopped
  bool _armed GUARDED_BY(_mutex) = false;
  std::unique_ptr<platform::ReadSource> _readSource GUARDED_BY(_mutex);
};

}  // namespace veltrad
