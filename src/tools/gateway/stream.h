// SPDX-License-Identifier: Apache-2.0
// The publishing side of the stream.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/result.h"
#include "base/thread.h"
#include "gateway/message.h"
#include "gateway/nats_connection.h"
#include "platform/limited_line.h"

namespace veltrad::gateway {

// Why the stream has not taken a message, from its answer: {"stream": …, "seq": …} or {"error":
// {"description": …}}. Empty: it has.
std::string refusalInAnswer(std::string_view text);

// Publishes without waiting for answers. A thread of its own makes the stream where it is missing and asks
// every second whether it is there.
class Stream {
 public:
  struct Listener {
    // The stream has answered. `why` is empty if it has taken the message.
    std::function<void(std::uint64_t token, const std::string& why)> answered;
    // The servers can be reached again, or the stream is there again.
    std::function<void()> back;
  };

  // The listener is called on threads of the library, until the destructor has returned.
  static Result<std::unique_ptr<Stream>, std::string> open(StreamOptions options, Listener listener);
  ~Stream();

  // The answer brings the token. Nothing happens while no server can be reached.
  void publish(std::uint64_t token, const Message& message);
  // Whether the stream was there when it was asked last.
  bool ready() const { return _ready.load(std::memory_order_relaxed); }

 private:
  struct Link;
  Stream(StreamOptions options, Listener listener);
  std::shared_ptr<Link> link();
  void watch();
  void look();
  // Makes another connection where this one is over.
  void renew();
  // Why the stream is not there, as one line; empty: it is.
  std::string faultOfStream();

  const StreamOptions _options;
  const Listener _listener;
  platform::LimitedLine _unpublished{"messages"};
  std::atomic<bool> _ready{false};
  // The fault that the log knows; absent: nothing was said yet. Of the watching thread.
  std::optional<std::string> _said;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  std::shared_ptr<Link> _link GUARDED_BY(_mutex);
  bool _stopping GUARDED_BY(_mutex) = false;
  Thread _watch;
};

}  // namespace veltrad::gateway
