// What a dashboard back end does on the network: its socket, its waiting datagrams, its timer. Any thread;
// ticks and acknowledgements come on the work pool.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

#include "backends/dashboard/delivery_schedule.h"
#include "backends/dashboard/message_queue.h"
#include "backends/dashboard/pool_timer.h"
#include "backends/dashboard/read_source.h"
#include "backends/dashboard/udp_socket.h"
#include "backends/lock_ranks.h"
#include "base/mutex.h"
#include "platform/memory_budget.h"

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

class DashboardQueues;
class WorkPool;

// A serial queue: one thing at a time, in the order in which it came, on the thread that brings it; a first
// transmission never blocks and costs no change of thread. The armed timer keeps it alive after its back ends
// (one, or those of one-shot messages) until nothing waits, the last resort, or end(); the socket is closed
// then, or with the object, once. What waits is charged to the user, and the socket when it outlives its back
// ends. `counters` must outlive it.
class NetworkProcQueue final : public std::enable_shared_from_this<NetworkProcQueue> {
 public:
  struct Kind {
    bool reliableUDP = false;
    bool shared = false;  // by one-shot messages
    std::chrono::milliseconds period{};
  };
  // For one back end. `socket` is connected. `account`: null, nobody pays.
  NetworkProcQueue(UDPSocket socket, std::unique_ptr<PoolTimer> timer, const Kind& kind,
                   std::shared_ptr<platform::MemoryAccount> account, std::shared_ptr<DashboardQueues> queues,
                   platform::Counters& counters);
  // Counts the datagrams that still wait as lost.
  ~NetworkProcQueue();

  // Acknowledgements are read from now on; false: they cannot be.
  bool startReading(WorkPool& pool);
  // No lock is held: older things of the user may have to make room.
  void tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber);
  // One back end more, which calls cleanup(); false: it has stopped already.
  bool join();
  // One back end lets go. With the last it stops: at once when nothing waits, else when nothing waits any
  // more, 9.5 s after the next tick at the latest.
  void cleanup();
  // Others need the room: what waits is given up, unless a back end has come since.
  void end();
  bool reliableUDP() const { return _kind.reliableUDP; }

 private:
  void timerFired();
  void myPeriodicTask(DeliverySchedule::Time now) REQUIRES(_mutex);
  void armTimer(DeliverySchedule::Time now) REQUIRES(_mutex);
  void awaitReading() REQUIRES(_mutex);
  void readable();
  bool processSocketRead() REQUIRES(_mutex);
  void cleanupSources() REQUIRES(_mutex);
  std::optional<platform::Charge> chargeFor(std::size_t datagram) const;
  // False: there is no room for a socket that outlives its back ends.
  bool chargeSocket() REQUIRES(_mutex);
  void giveUp(wire::Reason reason) REQUIRES(_mutex);

  // Constant after construction.
  platform::Counters& _counters;
  const Kind _kind;
  const std::shared_ptr<platform::MemoryAccount> _account;
  const std::shared_ptr<DashboardQueues> _queues;

  Mutex _mutex BACKEND_LOCK;
  UDPSocket _socket GUARDED_BY(_mutex);
  MessageQueue _messageQueue GUARDED_BY(_mutex);
  DeliverySchedule _schedule GUARDED_BY(_mutex);
  std::unique_ptr<PoolTimer> _timer GUARDED_BY(_mutex);  // null: stopped
  bool _armed GUARDED_BY(_mutex) = false;
  std::size_t _backEnds GUARDED_BY(_mutex) = 1;
  std::optional<platform::Charge> _socketCharge GUARDED_BY(_mutex);
  std::unique_ptr<ReadSource> _readSource GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
