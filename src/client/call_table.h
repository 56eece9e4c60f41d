// The calls of one session that are under way, and what has come for its callbacks. Under its connection's
// lock.
#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <unordered_map>

#include "base/mutex.h"
#include "base/value.h"
#include "client/answer.h"
#include "client/uploaded_file.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// Events that may wait for a slow event handler; the next is dropped and counted.
inline constexpr std::size_t kMostWaitingEvents = 4096;

// A thread that waits for one answer.
struct Waiter {
  Condition changed;
  Answer answer;
};

// Job: ends each call exactly once: its answer goes to the thread that waits for it, else into the queue of
// what the connection's thread is to run. Events join that queue.
class CallTable {
 public:
  struct Call {
    Waiter* waiter = nullptr;  // or else a callback
    veltra_callback callback = nullptr;
    void* context = nullptr;
    std::shared_ptr<UploadedFile> file;  // of an upload

    bool awaitsAnswer() const { return waiter || callback || file; }
  };
  // An event when there is no answer.
  struct Ready {
    veltra_callback callback = nullptr;
    void* context = nullptr;
    Answer answer;
    Dictionary event;
  };

  // Never 0, nor that of a call under way.
  std::uint32_t freeID() const;
  void add(std::uint32_t callID, Call call);
  // Of a call that is not under way: dropped.
  void answer(std::uint32_t callID, Answer answer);
  // Whoever takes the call's answer removes what it has lent.
  void askForRemoval(std::uint32_t callID);
  void addEvent(Dictionary event);
  // Ends all calls without an answer, the oldest first.
  void endAll(const char* why);

  bool anyReady() const { return !_ready.empty(); }
  // `batch` is empty.
  void takeReady(std::deque<Ready>& batch);
  // How many calls are under way that no thread waits for.
  std::size_t unwaited() const { return _unwaited; }
  // Replies, calls without an answer and dropped events.
  const veltra_statistics& counts() const { return _counts; }

 private:
  void finish(const Call& call, Answer answer);

  std::unordered_map<std::uint32_t, Call> _calls;
  std::size_t _unwaited = 0;  // of _calls
  std::uint32_t _lastID = 0;
  std::deque<Ready> _ready;
  std::size_t _readyEvents = 0;  // of _ready
  veltra_statistics _counts{};
};

}  // namespace veltrad::client
