// SPDX-License-Identifier: Apache-2.0
// The open calls of one session, and what has arrived for its callbacks. Used under its connection's lock.
#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <unordered_set>

#include "base/mutex.h"
#include "base/value.h"
#include "client/answer.h"
#include "client/uploaded_file.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// The number of events that may wait for the event handler. More are dropped and counted.
inline constexpr std::size_t kMostWaitingEvents = 4096;

// A thread that waits for one answer.
struct Waiter {
  Condition changed;
  Answer answer;
  std::uint32_t callID = 0;
};

// See veltra_state_callback.
struct StateChange {
  veltra_connection_state state;
  ValuePointer backends;
  // Null if no reason is known.
  std::optional<std::string> why;
};

// Ends each call exactly once: the answer goes to the thread that waits for it, else into the queue of
// callbacks that the connection's thread runs. Events and changes of state go into the same queue.
class CallTable {
 public:
  struct Call {
    // Null if no thread waits; then there may be a callback.
    Waiter* waiter = nullptr;
    veltra_callback callback = nullptr;
    void* context = nullptr;
    // The file of an upload.
    std::shared_ptr<UploadedFile> file;

    bool awaitsAnswer() const { return waiter || callback || file; }
  };
  // If there is neither an answer nor a change of state, it is an event.
  struct Ready {
    veltra_callback callback = nullptr;
    void* context = nullptr;
    Answer answer = nullptr;
    Dictionary event = {};
    std::unique_ptr<StateChange> change = nullptr;
  };

  // Neither 0 nor the ID of an open call. Each call gives another one.
  std::uint32_t takeID();
  void add(std::uint32_t callID, Call call);
  // Ignored if the call is not open.
  void answer(std::uint32_t callID, Answer answer);
  // The file that was lent for the call is removed once the call has its answer.
  void askForRemoval(std::uint32_t callID);
  void addEvent(Dictionary event);
  void addChange(StateChange change);
  // Ends all calls but those with these IDs without an answer, the oldest first.
  void endAllBut(const std::unordered_set<std::uint32_t>& kept, veltra_status status, const char* why);

  bool anyReady() const { return !_ready.empty(); }
  // `batch` must be empty.
  void takeReady(std::deque<Ready>& batch);
  // The number of open calls that no thread waits for.
  std::size_t unwaited() const { return _unwaited; }
  // Replies, calls that ended without an answer, and dropped events; the other fields are 0.
  const veltra_statistics& counts() const { return _counts; }

 private:
  void finish(const Call& call, Answer answer);

  std::unordered_map<std::uint32_t, Call> _calls;
  std::size_t _unwaited = 0;
  std::uint32_t _lastID = 0;
  std::deque<Ready> _ready;
  std::size_t _readyEvents = 0;
  veltra_statistics _counts{};
};

}  // namespace veltrad::client
