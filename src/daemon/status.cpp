// SPDX-License-Identifier: Apache-2.0
// Collects the status of all rooms.
#include "daemon/status.h"

#include <dirent.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <memory>

#include "base/null_value.h"
#include "base/text.h"
#include "base/version.h"
#include "config/client_types.h"
#include "config/owner_gate.h"
#include "daemon/veltrad_agent.h"
#include "http/server_records.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {

// Clients choose their names and may choose long ones: a reply must hold those of many sessions.
constexpr std::size_t kLongestText = 256;  // bytes

Value textOrNull(const std::string* text) {
  if (!text) return nullValue();
  return withoutIncompleteEnd(std::string_view(*text).substr(0, kLongestText));
}

Dictionary statusOfStorebag(const char* name, const StorebagRecord& record, double now, double jitter) {
  const bool attempted = record.attempted;
  return {{"name", name},
          {"version", textOrNull(record.version ? &*record.version : nullptr)},
          {"age", attempted ? std::abs(now - record.fetchTime) : nullValue()},
          {"state", !attempted               ? "never"
                    : record.fetchSuccessful ? "successful"
                                             : "failed"},
          {"nextAttempt", attempted ? record.fetchTime + record.wait(jitter) : nullValue()},
          {"refusal", textOrNull(record.refusal.empty() ? nullptr : &record.refusal)}};
}

Dictionary statusOfBackend(const backends::VeltraBackend& backend) {
  const backends::StateVerdict verdict = backend.stateVerdict();
  const wire::ReasonEntry& reason = wire::entryOf(verdict.reason);
  const backends::BackendActivity activity = backend.activity();
  return {{"name", backend.name()},
          {"state", verdict.state},
          {"reason", Dictionary{{"name", reason.name}, {"text", reason.text}}},
          {"held", activity.held},
          {"underWay", activity.underWay},
          {"lastOutcome", activity.lastOutcome.empty() ? nullValue() : activity.lastOutcome}};
}

Dictionary statusOfSession(const ListedSession& listed, const config::OwnerDecision& decision) {
  const session::FamilyFacts& facts = listed.facts;
  const Dictionary* info = facts.sessionInfo.get();
  // The session itself may not have applied the latest decision yet.
  Dictionary user = facts.userInfo ? *facts.userInfo : Dictionary();
  config::EditedFields edits;
  if (decision.fields) decision.fields->apply(user, edits);
  const auto clientType = info ? info->int32(wire::kVeltraSessionInfoClientType) : std::nullopt;
  Array backends;
  if (facts.backends) {
    for (const auto& [name, backend] : *facts.backends) backends.push_back(statusOfBackend(*backend));
  }
  return {{"id", listed.number},
          {"clientType", orNull(clientType)},
          {"sessionID", facts.sessionID},
          {"clientName", textOrNull(user.string(wire::kVeltraUserInfoClientName))},
          {"serviceName", textOrNull(user.string(wire::kVeltraUserInfoServiceName))},
          {"backends", std::move(backends)}};
}

}  // namespace

std::uint64_t residentBytes() {
  // Two numbers of pages: the whole size and what is resident. A stream of the library would not be
  // close-on-exec.
  const std::unique_ptr<FILE, int (*)(FILE*)> file(std::fopen("/proc/self/statm", "re"), std::fclose);
  char text[64];
  if (!file || !std::fgets(text, sizeof text, file.get())) return 0;
  char* resident = nullptr;
  static_cast<void>(std::strtoull(text, &resident, 10));
  return std::strtoull(resident, nullptr, 10) * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
}

Limit descriptorLimit() {
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  std::uint64_t used = 0;
  if (DIR* directory = ::opendir("/proc/self/fd")) {
    while (const dirent* entry = ::readdir(directory)) used += entry->d_name[0] != '.';
    ::closedir(directory);
    --used;  // the one that it was read through
  }
  return {"descriptors", used, limit.rlim_cur};
}

Dictionary statusOfDaemon(const DaemonFacts& facts) {
  Array limits;
  for (const Limit& limit : facts.limits) {
    limits.push_back(Dictionary{{"name", limit.name}, {"used", limit.used}, {"limit", limit.limit}});
  }
  return {
      {"version", kVersion},
      {"pid", static_cast<int>(::getpid())},
      {"uptime", facts.now - facts.started},
      {"memory", Dictionary{{"resident", residentBytes()}}},
      {"limits", std::move(limits)},
      {"clock", facts.now < kEarliestTime ? Value("before this program was made: no storebag expires by it")
                                          : nullValue()}};
}

Array statusOfStorebags(StorebagCache& cache, double now) {
  auto records = cache.records();
  for (const std::string& name : config::storebagNames()) records.try_emplace(name);
  Array storebags;
  const double jitter = cache.jitter();
  for (const auto& [name, record] : records)
    storebags.push_back(statusOfStorebag(name.c_str(), record, now, jitter));
  return storebags;
}

Array statusOfServers(const std::vector<http::ServerRecord>& servers) {
  Array all;
  for (const http::ServerRecord& server : servers) {
    all.push_back(Dictionary{{"address", server.address},
                             {"lastSuccess", orNull(server.lastSuccess)},
                             {"failures", server.failures}});
  }
  return all;
}

Dictionary statusOfSessions(VeltradAgent& agent, const config::OwnerDecision& decision, std::uint64_t after) {
  // With five back ends each and long names, so many sessions stay below a frame's bounds.
  constexpr std::size_t kMost = 200;
  const auto all = agent.sessions();
  const auto parents = agent.parents();
  std::map<const session::Aggregation*, std::uint64_t> numbers;
  for (const ListedSession& listed : all) numbers.emplace(listed.facts.aggregation.get(), listed.number);
  Array sessions;
  bool more = false;
  for (const ListedSession& listed : all) {
    if (listed.number <= after) continue;
    if (sessions.size() == kMost) {
      more = true;
      break;
    }
    Dictionary status = statusOfSession(listed, decision);
    const auto parent = parents.find(listed.facts.aggregation.get());
    const auto number = parent == parents.end() ? numbers.end() : numbers.find(parent->second);
    if (number != numbers.end()) status.set("parent", number->second);
    sessions.push_back(std::move(status));
  }
  return {{"sessions", std::move(sessions)}, {"more", more}};
}

}  // namespace veltrad::daemon
