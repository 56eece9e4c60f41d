// SPDX-License-Identifier: Apache-2.0
// Makes refusing answers, counts them, and stores malformed bodies separately.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "gateway/http_server.h"
#include "gateway/publisher.h"
#include "support/gunzip.h"

namespace veltrad::gateway {

// Why a request was refused: the name under which it is counted, and a line for people.
struct Refusal {
  int status;
  const char* reason;
  std::string detail;
};

// Limits what is kept: at most ten in a second.
class KeepingRate {
 public:
  using Time = std::chrono::steady_clock::time_point;
  static constexpr int kMostASecond = 10;

  bool allows(Time now);

 private:
  std::optional<Time> _second;
  int _kept = 0;
};

// Any thread. The publisher and the metrics must outlive it.
class Refusals {
 public:
  static constexpr std::size_t kMostKeptBytes = 64u << 10;

  // `shed`: the status in place of 429.
  Refusals(Publisher& publisher, Metrics& metrics, int shed)
      : _publisher(publisher), _metrics(metrics), _shed(shed) {}

  Answer answer(const Refusal& refusal);
  // The same for a body that is malformed, which is kept apart.
  Answer malformed(const char* reason, const std::string& detail, std::string_view body);
  // For a gzip stream that is not as it should be: cut short if its state is "open". `most`: what it may
  // unpack to.
  Answer gzip(support::Gunzip::State state, std::uint64_t most, std::string_view body);
  // For what the stream has not taken, or that there is no room for.
  Answer busy(const char* reason);

 private:
  bool isKept();

  Publisher& _publisher;
  Metrics& _metrics;
  const int _shed;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  KeepingRate _rate GUARDED_BY(_mutex);
};

}  // namespace veltrad::gateway
