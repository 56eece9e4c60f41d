// SPDX-License-Identifier: Apache-2.0
// The calls of one session that wait to be written. Used under its connection's lock.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <deque>
#include <string>
#include <unordered_set>

#include "client/sent_record.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// Keeps calls in order and writes them without blocking. A call waits until its last byte is written. A call
// of which no byte was written waits for the next connection.
class OutFrames {
 public:
  // At most `most` bytes may wait, or one larger call. `record` must outlive it.
  OutFrames(std::size_t most, SentRecord& record) : _most(most), _record(record) {}

  // The socket of a new connection. `first`, whole frames, is written before the calls, which wait until
  // release().
  void connect(int socket, std::string first);
  // From now on the calls are written.
  void release();
  // Stops writing; what waits goes on waiting.
  void hold();
  // The connection has ended. A call of which a part was written is dropped.
  void disconnect();
  // Accepts no more calls.
  void close() { _closed = true; }
  // The same, and drops what waits.
  void stop();

  // Writes as much of the call as possible if no other waits; the rest waits. If its header announces a
  // descriptor, `file` must be open. The call is dropped if the result is VELTRA_QUEUE_FULL or, after
  // close() or stop(), VELTRA_NO_DAEMON.
  veltra_status write(OutCall call);
  // Counts a call that was not accepted.
  veltra_status refuse(veltra_status why);
  // Writes as much as possible of what waits.
  void writeWaiting();
  // Removes a waiting call. False if it is not waiting, or if a part of it was written.
  bool withdraw(std::uint32_t callID);

  bool empty() const { return _calls.empty() && _first.empty(); }
  // Something waits for room in the socket.
  bool writing() const;
  std::size_t waiting() const { return _calls.size(); }
  // The call IDs of what waits.
  std::unordered_set<std::uint32_t> waitingIDs() const;
  // Calls that were not accepted.
  std::uint64_t refused() const { return _refused; }

 private:
  enum class Gate { apart, first, open };

  bool writeFirst();
  bool writeAll();
  ssize_t send();
  void taken(std::size_t count);

  const std::size_t _most;
  SentRecord& _record;
  bool _closed = false;
  // apart: nothing is written. first: the frames before the calls.
  Gate _gate = Gate::apart;
  int _socket = -1;
  std::string _first;
  std::deque<OutCall> _calls;
  // Bytes of the first call that were written.
  std::size_t _taken = 0;
  // Bytes of calls that wait.
  std::size_t _bytes = 0;
  std::uint64_t _refused = 0;
};

}  // namespace veltrad::client
