// SPDX-License-Identifier: Apache-2.0
// The status of the running daemon for `veltractl status`, as property list values. The caller's thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::config {
struct OwnerDecision;
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

// Resident memory of this process in bytes, and its open descriptors with their limit, from /proc. 0 if /proc
// cannot be read.
std::uint64_t residentBytes();
Limit descriptorLimit();

struct DaemonFacts {
  double started = 0;  // seconds since 1970
  double now = 0;
  std::vector<Limit> limits;
};

// {"version", "pid", "uptime", "memory": {"resident"}, "limits": [{"name", "used", "limit"}]}
Dictionary statusOfDaemon(const DaemonFacts& facts);

// One for each storebag name of a client type, even if no session has asked for it: {"name", "version",
// "age", "state": "successful" | "failed" | "never", "nextAttempt"}. Unknown values are NaN, which JSON
// writes as null; so in all answers below.
Array statusOfStorebags(StorebagCache& cache, double now);

// {"address", "lastSuccess", "failures"}
Array statusOfServers(const std::vector<http::ServerRecord>& servers);

// The sessions that came after number `after`, in the order of arrival, as many as one reply can carry:
// {"sessions": [{"id", "parent", "clientType", "sessionID", "clientName", "serviceName", "backends":
// [{"name", "state", "reason": {"name", "text"}, "held", "underWay", "lastOutcome"}]}], "more": true where
// there are others}. "id" is the number, "parent" that of the parent session, if there is one. Names are
// truncated to 256 bytes; names that the owner withholds are left out.
Dictionary statusOfSessions(VeltradAgent& agent, const config::OwnerDecision& decision, std::uint64_t after);

}  // namespace veltrad::daemon
