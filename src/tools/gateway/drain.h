// SPDX-License-Identifier: Apache-2.0
// Carries messages from the stream to the tables, on a thread of its own, until it is stopped.
#pragma once

#include <atomic>
#include <chrono>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "base/mutex.h"
#include "base/thread.h"
#include "gateway/options.h"
#include "gateway/piece_store.h"
#include "gateway/stream_reader.h"
#include "gateway/table_writer.h"
#include "platform/limited_line.h"

namespace veltrad::gateway {

// Decides what may be purged from the stream: places that were reached long enough ago.
class PurgePlan {
 public:
  using Time = std::chrono::steady_clock::time_point;

  explicit PurgePlan(std::chrono::duration<double> after) : _after(after) {}

  // Everything up to `seq` is in the tables.
  void reached(std::uint64_t seq, Time now);
  // Up to where the stream may forget now; absent: nothing new.
  std::optional<std::uint64_t> due(Time now);

 private:
  std::chrono::duration<double> _after;
  std::deque<std::pair<Time, std::uint64_t>> _reached;
};

// Detects whether a stream has lost its newest messages, as after a power cut of all its servers. A new
// leader may at first report fewer messages than it has, so the loss must persist.
class LostTail {
 public:
  using Time = std::chrono::steady_clock::time_point;
  static constexpr std::chrono::seconds kLongestCatchUp{20};

  // `last` is the last place in the stream, `reached` that in the tables.
  bool isCertain(std::uint64_t reached, std::uint64_t last, Time now);

 private:
  std::optional<Time> _since;
};

struct DrainCounts {
  std::atomic<std::uint64_t> events{0};
  std::atomic<std::uint64_t> messages{0};
  std::atomic<std::uint64_t> skipped{0};
  std::atomic<std::uint64_t> refused{0};
  std::atomic<std::uint64_t> restarts{0};
  std::atomic<std::uint64_t> behind{0};
  // No message that waits to be written is older; nanoseconds since 1970.
  std::atomic<std::int64_t> waitingSince{0};
  std::atomic<bool> active{false};

  std::string text() const;
};

// Its 13 fields are its settings, its counts, where it stands in the stream, and its thread.
class Drain {
 public:
  Drain(StreamOptions stream, DrainArguments given);
  ~Drain() { stop(); }

  // The error says what the operator must repair: the folder of files.
  Result<Done, std::string> start();
  // After the batch that is being written.
  void stop();
  const DrainCounts& counts() const { return _counts; }

 private:
  void run();
  // From its connections to the first error, or the stop; the error is one line.
  std::string runOnce();
  std::string carry(StreamReader& reader, TableWriter& writer);
  // The place behind which to read.
  Result<std::uint64_t, std::string> findPlace(StreamReader& reader, TableWriter& writer, StreamState& state);
  static Result<std::uint64_t, std::string> placeUpTo(StreamReader& reader, const StreamState& state,
                                                      std::uint64_t seq, std::int64_t time);
  std::string lookAgain(StreamReader& reader, std::int64_t created);
  void measure(StreamReader& reader);
  // `read`: the time of the last message that was written; 0: none yet.
  void keepHouse(StreamReader& reader, TableWriter& writer, std::int64_t read);
  bool stopping();
  bool pause(std::chrono::milliseconds time);

  const StreamOptions _stream;
  const DrainArguments _given;
  PieceStore _files;
  DrainCounts _counts;
  platform::LimitedLine _begins{"beginnings"};
  // The purge plan of the stream that is being read.
  PurgePlan _purges;
  std::chrono::steady_clock::time_point _nextForgetting{};
  std::uint64_t _reached = 0;
  // The place after which nothing came although the stream has more; 0 if none.
  std::uint64_t _silentAt = 0;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  Condition _changed;
  bool _stopping GUARDED_BY(_mutex) = false;
  Thread _thread;
};

}  // namespace veltrad::gateway
