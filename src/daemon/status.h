// SPDX-License-Identifier: Apache-2.0
// What `veltractl status` shows of the running daemon, as property list values. The asking thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::config {
struct OwnersWord;
}  // namespace veltrad::config

namespace veltrad::http {
struct ServerRecord;
}  // namespace veltrad::http

namespace veltrad::daemon {

struct StorebagRecord;
class StorebagCache;
class VeltradAgent;

// How full a bound is.
struct Limit {
  std::string name;
  std::uint64_t used = 0;
  std::uint64_t limit = 0;
};

// Of this process, from /proc: resident memory in bytes, and open descriptors beside the most that it may
// have. 0 where /proc cannot be read.
std::uint64_t residentBytes();
Limit descriptorLimit();

struct DaemonFacts {
  double started = 0;  // seconds since 1970
  double now = 0;
  std::vector<Limit> limits;
};

// {"version", "pid", "uptime", "memory": {"resident"}, "limits": [{"name", "used", "limit"}]}
Dictionary statusOfDaemon(const DaemonFacts& facts);

// One for each name that a client type has, also where nobody has asked for it:
// {"name", "version", "age", "state": "successful" | "failed" | "never", "nextAttempt"}. What is not known is
// not a number, which JSON writes as null; so in all that follows.
Array statusOfStorebags(StorebagCache& cache, double now);

// {"address", "lastSuccess", "failures"}
Array statusOfServers(const std::vector<http::ServerRecord>& servers);

// The sessions that came after number `after`, in the order of arrival, as many as one reply can carry:
// {"sessions": [{"id", "parent", "clientType", "sessionID", "clientName", "serviceName", "backends":
// [{"name", "state", "reason": {"name", "text"}, "held", "underWay", "lastOutcome"}]}], "more": true where
// there are others}. "id" is the number, "parent" that of the parent session, if there is one. Of a name, the
// first 256 bytes; names that the owner keeps back stay back.
Dictionary statusOfSessions(VeltradAgent& agent, const config::OwnersWord& word, std::uint64_t after);

}  // namespace veltrad::daemon
