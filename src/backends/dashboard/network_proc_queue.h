// SPDX-License-Identifier: Apache-2.0
// The network side of a dashboard back end: its socket, waiting datagrams and timer. Any thread; ticks and
// acknowledgements are handled on the work pool.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/dashboard/delivery_schedule.h"
#include "backends/dashboard/message_queue.h"
#include "backends/dashboard/pool_timer.h"
#include "backends/dashboard/read_source.h"
#include "backends/dashboard/udp_socket.h"
#include "backends/lock_ranks.h"
#include "base/mutex.h"
#include "config/owner_gate.h"
#include "platform/counters.h"
#include "platform/fate_writer.h"
#include "platform/memory_budget.h"
#include "wire/fates.h"

namespace veltrad::backends {

class DashboardQueues;
class WorkPool;

// Serialises its operations with a lock; each runs on the caller's thread, and a first transmission never
// blocks. After its back ends (one, or those of one-shot messages) have gone, the armed timer keeps it alive
// until nothing waits, the last resort is due, or end() is called; the socket is closed then. Waiting
// datagrams are charged to the user, and so is the socket once it outlives the back ends. `counters` must
// outlive the queue.
//
// Its 13 fields are the socket, the waiting datagrams and the timer; they end together, under one lock.
class NetworkProcQueue final : public std::enable_shared_from_this<NetworkProcQueue> {
 public:
  struct Kind {
    bool reliableUDP = false;
    bool shared = false;
    std::chrono::milliseconds period{};
    // The dashboard's host, for the check whether it may be contacted.
    std::string host;
    std::string address;  // "udp://IP:PORT"
    // Counts for the owner's daily limits; must outlive the queue. May be null.
    config::OwnerGate* gate = nullptr;
    platform::FateWriter pen = {};
  };
  // Starts with one back end. `socket` is connected. `account` may be null.
  NetworkProcQueue(UDPSocket socket, std::unique_ptr<PoolTimer> timer, const Kind& kind,
                   std::shared_ptr<platform::MemoryAccount> account, std::shared_ptr<DashboardQueues> queues,
                   platform::Counters& counters);
  // Counts the datagrams that still wait as lost.
  ~NetworkProcQueue();

  // From now on acknowledgements are read. False if they cannot be.
  bool startReading(WorkPool& pool);
  // Called without a lock, because older data of the user may be dropped to make room.
  // `fate`: what the record says of it.
  wire::Decision tryToSendMsg(std::string_view datagram, std::uint16_t eventNumber,
                              const DatagramOwner& owner = {}, const wire::StepEntry& fate = {});
  // Adds a back end, which later calls cleanup(). False if the queue has already stopped; with `alone` also
  // if acknowledgements could be confused with those of other datagrams.
  bool join(bool alone);
  // Removes a back end. After the last one the queue stops as soon as nothing waits, 9.5 s after the next
  // tick at the latest.
  void cleanup();
  // Gives up what waits, to make room for other queues, unless a back end has joined.
  void end();
  // Gives up what waits.
  void dropWaiting();
  const std::string& host() const { return _kind.host; }
  const std::string& address() const { return _kind.address; }
  bool reliableUDP() const { return _kind.reliableUDP; }

 private:
  void timerFired();
  void myPeriodicTask(DeliverySchedule::Time now) REQUIRES(_mutex);
  void armTimer(DeliverySchedule::Time now) REQUIRES(_mutex);
  void awaitReading() REQUIRES(_mutex);
  void readable();
  bool processSocketRead() REQUIRES(_mutex);
  void cleanupSources() REQUIRES(_mutex);
  // `events`: 1 for the first transmission, 0 for further ones, of which each counts its bytes.
  MessageQueue::Sending send(std::string_view datagram, std::uint64_t events) REQUIRES(_mutex);
  MessageQueue::Recorder recorder() const;
  std::optional<platform::Charge> chargeFor(std::size_t datagram) const;
  // False if the user has no memory left for a socket that outlives its back ends.
  bool chargeSocket() REQUIRES(_mutex);
  void note(std::uint64_t message, wire::Step step, wire::Reason reason) const;
  void noteFirst(const MessageQueue::First& first, wire::StepEntry fate) const;
  void noteEnd(wire::Reason ofSent, wire::Reason ofNotSent) const REQUIRES(_mutex);
  void giveUp(wire::Reason reason) REQUIRES(_mutex);

  platform::Counters& _counters;
  const Kind _kind;
  const std::shared_ptr<platform::MemoryAccount> _account;
  const std::shared_ptr<DashboardQueues> _queues;

  Mutex _mutex BACKEND_LOCK;
  UDPSocket _socket GUARDED_BY(_mutex);
  MessageQueue _messageQueue GUARDED_BY(_mutex);
  DeliverySchedule _schedule GUARDED_BY(_mutex);
  // Null once the queue has stopped.
  std::unique_ptr<PoolTimer> _timer GUARDED_BY(_mutex);
  bool _armed GUARDED_BY(_mutex) = false;
  std::size_t _backEnds GUARDED_BY(_mutex) = 1;
  std::optional<platform::Charge> _socketCharge GUARDED_BY(_mutex);
  std::unique_ptr<ReadSource> _readSource GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
