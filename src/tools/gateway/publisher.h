// SPDX-License-Identifier: Apache-2.0
// Holds messages until the stream has taken them, on a thread of its own.
#pragma once

#include <memory>
#include <string>

#include "base/mutex.h"
#include "base/thread.h"
#include "gateway/held_messages.h"
#include "gateway/metrics.h"
#include "gateway/stream.h"
#include "platform/limited_line.h"

namespace veltrad::gateway {

// Any thread. Its metrics must outlive it.
class Publisher {
 public:
  using Completion = HeldMessages::Completion;

  static Result<std::unique_ptr<Publisher>, std::string> open(const StreamOptions& stream,
                                                              HeldMessages::Bounds bounds, Metrics& metrics);
  // Completes everything that is held as late.
  ~Publisher();

  // The completion is called once: on this thread if there is no room or no memory, else on another one. It
  // must not block, and ends where it finds no memory.
  void publish(Message message, Completion completion);
  // From now on nothing is held beyond `end`.
  void endBy(HeldMessages::Time end);
  bool ready() const { return _stream && _stream->ready(); }
  std::size_t held() const;

 private:
  Publisher(HeldMessages::Bounds bounds, Metrics& metrics) : _metrics(metrics), _held(bounds) {}
  void run();
  void answered(std::uint64_t token, const std::string& why);

  Metrics& _metrics;
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  HeldMessages _held GUARDED_BY(_mutex);
  bool _stopping GUARDED_BY(_mutex) = false;
  platform::LimitedLine _refusals{"messages"};
  std::unique_ptr<Stream> _stream;
  Thread _thread;
};

}  // namespace veltrad::gateway
