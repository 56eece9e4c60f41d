// SPDX-License-Identifier: Apache-2.0
// The running daemon's status, for programs and for people.
#include "tools/ctl/status_report.h"

#include <fmt/format.h>

#include <cmath>
#include <cstdint>
#include <map>
#include <vector>

#include "tools/ctl/answer_fields.h"

namespace veltrad::ctl {

namespace {

using Listed = std::map<std::int64_t, std::vector<std::int64_t>>;

// Absent: null.
std::optional<double> real(const Dictionary& from, const char* key) {
  const auto value = from.real(key);
  return value && std::isfinite(*value) ? value : std::nullopt;
}

Value sessionWithChildren(std::int64_t id, std::map<std::int64_t, Dictionary>& sessions,
                          const Listed& below) {
  Dictionary session = std::move(sessions[id]);
  Array children;
  if (const auto at = below.find(id); at != below.end()) {
    for (const std::int64_t child : at->second)
      children.push_back(sessionWithChildren(child, sessions, below));
  }
  session.erase("id");
  session.erase("parent");
  session.set("children", std::move(children));
  return session;
}

const char* stateName(std::int64_t state) {
  constexpr const char* kNames[] = {"waiting", "disabled", "reporting", "held"};
  return state >= 0 && state < 4 ? kNames[state] : "unknown";
}

void addSession(std::string& out, const Dictionary& session, const std::string& indent) {
  const auto clientType = real(session, "clientType");
  out += fmt::format("\n{}{} {}: {}, client type {}", indent, "session", numberIn(session, "sessionID"),
                     textIn(session, "clientName", "no client name") + " / " +
                         textIn(session, "serviceName", "no service name"),
                     clientType ? fmt::format("{}", *clientType) : "unknown");
  for (const Dictionary* backend : dictionariesIn(session, "backends")) {
    const Dictionary* reason = backend->dictionary("reason");
    out +=
        fmt::format("\n{}  {:<13} {} ({} held, {} under way, last: {})", indent, textIn(*backend, "name", ""),
                    reason ? textIn(*reason, "text", "") : stateName(numberIn(*backend, "state")),
                    numberIn(*backend, "held"), numberIn(*backend, "underWay"),
                    textIn(*backend, "lastOutcome", "nothing yet"));
  }
  for (const Dictionary* child : dictionariesIn(session, "children"))
    addSession(out, *child, indent + "    ");
}

void addDaemon(std::string& out, const Dictionary& daemon) {
  const Dictionary* memory = daemon.dictionary("memory");
  out += fmt::format("veltrad {}, process {}, up {}, {:.1f} MiB resident", textIn(daemon, "version", "?"),
                     numberIn(daemon, "pid"), formatDuration(real(daemon, "uptime").value_or(0)),
                     memory ? static_cast<double>(numberIn(*memory, "resident")) / (1 << 20) : 0.0);
  for (const Dictionary* limit : dictionariesIn(daemon, "limits")) {
    const double used = static_cast<double>(numberIn(*limit, "used"));
    const double most = static_cast<double>(numberIn(*limit, "limit"));
    const std::string name = textIn(*limit, "name", "");
    const double unit = name == "memory" ? 1 << 20 : 1;
    out += fmt::format("\n  {:<13} {:.0f} of {:.0f}{} ({:.0f} %)", name, used / unit, most / unit,
                       unit > 1 ? " MiB" : "", most > 0 ? 100 * used / most : 0);
  }
  if (daemon.string("clock")) out += "\n  the clock is " + textIn(daemon, "clock", "");
}

void addStorebags(std::string& out, const Dictionary& status, double now) {
  std::size_t never = 0;
  out += "\n\nStorebags";
  for (const Dictionary* storebag : dictionariesIn(status, "storebags")) {
    const auto age = real(*storebag, "age");
    if (!age) {
      ++never;
      continue;
    }
    const double wait = real(*storebag, "nextAttempt").value_or(now) - now;
    out += fmt::format(
        "\n  {:<13} version {}, {} {} ago, next attempt {}", textIn(*storebag, "name", ""),
        textIn(*storebag, "version", "unknown"),
        textIn(*storebag, "state", "") == "successful" ? "fetched" : "fetch failed", formatDuration(*age),
        wait > 0 ? "not before " + formatDuration(wait) + " from now" : "with the next session");
    if (storebag->string("refusal"))
      out += "\n    the last one was refused: " + textIn(*storebag, "refusal", "");
  }
  if (never > 0) out += fmt::format("\n  {} others: no session has asked for them", never);
}

void addServers(std::string& out, const Dictionary& status, double now) {
  const auto servers = dictionariesIn(status, "servers");
  if (!servers.empty()) out += "\n\nServers";
  for (const Dictionary* server : servers) {
    const auto last = real(*server, "lastSuccess");
    out += fmt::format("\n  {}: last success {}, {} failures since", textIn(*server, "address", ""),
                       last ? formatDuration(now - *last) + " ago" : "never", numberIn(*server, "failures"));
  }
}

void addSpool(std::string& out, const Dictionary& spool, double now) {
  const auto oldest = real(spool, "oldest");
  out += fmt::format("\n\nSpool\n  {} posts, {} bytes{}", numberIn(spool, "posts"), numberIn(spool, "bytes"),
                     oldest ? ", the oldest " + formatDuration(now - *oldest) + " old" : "");
  for (const Dictionary* address : dictionariesIn(spool, "addresses")) {
    const double wait = real(*address, "nextTry").value_or(now) - now;
    out += fmt::format("\n  {}: {} posts, last error: {}, next try {}", textIn(*address, "address", ""),
                       numberIn(*address, "posts"), textIn(*address, "lastError", "none"),
                       wait > 0 ? "in " + formatDuration(wait) : "now");
  }
}

}  // namespace

Array treeOfSessions(Array listed) {
  std::map<std::int64_t, Dictionary> sessions;
  for (Value& one : listed) {
    if (auto session = std::move(one).takeDictionary()) {
      const std::int64_t id = numberIn(*session, "id");
      sessions.emplace(id, std::move(*session));
    }
  }
  Listed below;  // 0: of no parent
  for (const auto& [id, session] : sessions) {
    const std::int64_t parent = numberIn(session, "parent");
    below[sessions.contains(parent) ? parent : 0].push_back(id);
  }
  Array tree;
  for (const std::int64_t id : below[0]) tree.push_back(sessionWithChildren(id, sessions, below));
  return tree;
}

std::string formatDuration(double seconds) {
  const auto whole = static_cast<std::int64_t>(std::max(0.0, seconds));
  constexpr std::int64_t kMinute = 60, kHour = 3600, kDay = 86400;
  if (whole < kMinute) return fmt::format("{} s", whole);
  if (whole < kHour) return fmt::format("{} min", whole / kMinute);
  if (whole < kDay) return fmt::format("{} h {} min", whole / kHour, whole % kHour / kMinute);
  return fmt::format("{} d {} h", whole / kDay, whole % kDay / kHour);
}

std::string formatStatus(const Dictionary& status, double now) {
  std::string out;
  if (const Dictionary* daemon = status.dictionary("daemon")) addDaemon(out, *daemon);
  const auto sessions = dictionariesIn(status, "sessions");
  out += sessions.empty() ? "\n\nNo session is open." : "\n\nSessions";
  for (const Dictionary* session : sessions) addSession(out, *session, "  ");
  addStorebags(out, status, now);
  addServers(out, status, now);
  if (const Dictionary* spool = status.dictionary("spool")) addSpool(out, *spool, now);
  return out;
}

}  // namespace veltrad::ctl
