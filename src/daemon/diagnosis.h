// SPDX-License-Identifier: Apache-2.0
// The checks of `veltractl doctor`: each maps facts to a result with one advice. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "config/storebag_source.h"
#include "daemon/refusal_advice.h"
#include "ipc/entitlements.h"

namespace veltrad::daemon {

struct Check {
  // skipped: the check is impossible because another check failed.
  enum class Result { ok, warning, failure, skipped };
  const char* name;  // of wire::check::kNames
  Result result;
  std::string text;  // one line
  std::string mend;  // one line; empty unless there is a warning or a failure
};

// "ok", "warning", "failure", "skipped".
const char* nameOf(Check::Result result);

struct EntitlementFacts {
  std::optional<ipc::RulesState> rules;  // absent: they cannot be read just now
  std::string path;
  unsigned uid = 0;      // of who asks
  bool granted = false;  // to who asks
};

struct AddressFacts {
  std::optional<std::string> inUse;      // absent: it cannot be read just now
  std::optional<std::string> preferred;  // the preference as it is now, which holds from the next start on
  std::string deploymentPath;
  std::string deploymentProblem;
};

// The result of one request for a storebag.
struct StorebagFinding {
  std::string name;
  config::StorebagAnswer answer;
  std::optional<std::string> version;
  // The daemon's record says that the last fetch succeeded, and has no section.
  bool emptyRecord = false;
};

struct StorebagFacts {
  // In the order in which they were asked for. None follows one whose server gave no answer.
  std::vector<StorebagFinding> findings;
  bool needed = false;            // asked for by name or by a session, not for want of both
  const char* section = nullptr;  // that the environment names; null: none
  std::string certificatesPath;
  std::string publicKeyPath;
  RefusalPlaces places;
  std::vector<std::int32_t> typesWithout;  // asked for, and without a storebag
};

// True if the server gave no answer, so that further storebags need not be requested.
bool endsAtServer(config::StorebagCause cause);

// policyBroken, reportingOff: the owner's decision, which overrides consent.
enum class Consent { given, refused, neverGiven, noBoolean, notKnown, policyBroken, reportingOff };

struct MachineFacts {
  Consent consent = Consent::notKnown;
  std::string messageLogPath;
  std::string messageLogProblem;  // empty: it can be written
  bool sandboxInForce = false;
  std::string sandboxLine;
  std::uint64_t descriptors = 0;        // the soft limit
  std::uint64_t descriptorsNeeded = 0;  // for all that docs/limits.md promises
  double now = 0;                       // seconds since 1970
};

// Fewer descriptors are not enough for a start and a few clients with a post each.
inline constexpr std::uint64_t kFewestDescriptors = 100;

// All checks of the daemon, in the order of wire::check::kNames after "daemon".
std::vector<Check> diagnose(const EntitlementFacts& entitlement, const AddressFacts& address,
                            const StorebagFacts& storebags, const MachineFacts& machine);

}  // namespace veltrad::daemon
