// SPDX-License-Identifier: Apache-2.0
// The latest results of requests, by server. Any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "base/mutex.h"

namespace veltrad::http {

struct ServerRecord {
  std::string address;                // scheme, host and port where it was given: "https://h.example:8443"
  std::optional<double> lastSuccess;  // when it last answered with a status below 400, seconds since 1970
  std::uint64_t failures = 0;         // answers from 400 on and transport errors since then
};

class ServerRecords {
 public:
  // The number of remembered servers; the least recently used one is replaced.
  static constexpr std::size_t kMost = 256;

  // `host`: "name:port", as the URL had it. `now`: seconds since 1970.
  void ended(const std::string& host, bool success, double now);
  // By address.
  std::vector<ServerRecord> all() const;

 private:
  struct Entry {
    std::optional<double> lastSuccess;
    std::uint64_t failures = 0;
    std::uint64_t lastUse = 0;
  };

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, Entry> _entries GUARDED_BY(_mutex);
  std::uint64_t _uses GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::http
