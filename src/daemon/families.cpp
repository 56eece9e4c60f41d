// SPDX-License-Identifier: Apache-2.0
// Adds and removes sessions, refreshes families and finds the session that gets a copy.
#include "daemon/families.h"

#include <utility>

#include "base/text.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {
// Bounds for empty lists, because clients may invent identities. The length is in bytes.
constexpr std::size_t kMostKeys = 4096;
constexpr std::size_t kLongestIdleKey = 256;

// The lower-cased client name, ":", the lower-cased service name. A missing name is empty.
std::string userInfoKeyForUserInfo(const Dictionary* userInfo) {
  const std::string* client = userInfo ? userInfo->string(wire::kVeltraUserInfoClientName) : nullptr;
  const std::string* service = userInfo ? userInfo->string(wire::kVeltraUserInfoServiceName) : nullptr;
  return (client ? lowerCase(*client) : "") + ":" + (service ? lowerCase(*service) : "");
}

// For log lines: the key, unless the owner of the device withholds one of its parts.
const char* shown(const std::string& key, const session::FamilyFacts& facts) {
  return facts.userInfo == facts.sentUserInfo ? key.c_str() : "(kept back)";
}
}  // namespace

void Families::tell(FamilyMember& member, session::FamilyFacts& facts, std::string& key) {
  std::swap(member.facts, facts);
  std::swap(member.key, key);
}

void Families::sessionInfoUpdated(session::FamilyFacts facts) {
  std::string key = userInfoKeyForUserInfo(facts.userInfo.get());
  const Lock held(_lock);
  const auto member = _members.find(facts.aggregation.get());
  if (member != _members.end()) tell(member->second, facts, key);
}

void Families::userInfoUpdatedForSession(session::FamilyFacts facts) {
  if (!facts.userInfo) {
    logInfo("userInfoUpdatedForSession: No user info found for session %u", facts.sessionID);
    return sessionInfoUpdated(std::move(facts));
  }
  const std::string key = userInfoKeyForUserInfo(facts.userInfo.get());
  Members::node_type left;
  const Lock held(_lock);
  const session::Aggregation* session = facts.aggregation.get();
  left = takeOut(*session);
  logDebug("userInfoUpdatedForSession: Adding session %u to list for userInfoKey %s", facts.sessionID,
           shown(key, facts));
  const auto home = _correlatedSessions.try_emplace(std::pmr::string(key)).first;
  const auto member = _members.try_emplace(session, FamilyMember{std::move(facts), key, home}).first;
  home->second.join(member->second);
  _userInfoKeyCount.store(_correlatedSessions.size(), std::memory_order_relaxed);
}

Families::Parents Families::parents() {
  Parents parents;
  const Lock held(_lock);
  for (const auto& [session, member] : _members) {
    const FamilyMember* parent =
        member.home->second.getFirstSessionWithHierarchy(std::int64_t{member.level} - 1);
    if (parent) parents.emplace(session, parent->facts.aggregation.get());
  }
  return parents;
}

void Families::leave(const session::Aggregation& session) {
  Members::node_type left;
  const Lock held(_lock);
  left = takeOut(session);
  _userInfoKeyCount.store(_correlatedSessions.size(), std::memory_order_relaxed);
}

Families::Members::node_type Families::takeOut(const session::Aggregation& session) {
  auto left = _members.extract(&session);
  if (left.empty()) return left;
  const auto home = left.mapped().home;
  home->second.leave(left.mapped());
  const bool idles = home->first.size() <= kLongestIdleKey && _correlatedSessions.size() <= kMostKeys;
  if (home->second.empty() && !idles) _correlatedSessions.erase(home);
  return left;
}

const CorrelatedList* Families::list(std::string_view key) const {
  const auto found = _correlatedSessions.find(key);
  return found == _correlatedSessions.end() ? nullptr : &found->second;
}

// The list of the member's key; null, after a log line, if the member is not in it.
const CorrelatedList* Families::listHolding(const FamilyMember& member, const char* operation) const {
  const CorrelatedList* named = list(member.key);
  if (!named || named->empty()) {
    logError("%s: ERROR: No sessions found for user info key %s", operation, member.key.c_str());
    return nullptr;
  }
  if (named != &member.home->second) {
    logError("%s: ERROR: Session %u not found for user info key %s", operation, member.facts.sessionID,
             member.key.c_str());
    return nullptr;
  }
  return named;
}

std::optional<std::string> Families::parentSessionIDString(const FamilyMember& member) const {
  if (member.level == 0) return std::nullopt;
  logDebug("parentSessionIDStringForSession: Checking userInfoKey '%s' for session %u",
           shown(member.key, member.facts), member.facts.sessionID);
  const CorrelatedList* list = listHolding(member, "parentSessionIDStringForSession");
  if (!list || member.level < 0) return std::nullopt;
  AncestorIDs ids = list->ancestorIDs(member.level);
  if (!ids.complete) {
    logInfo(
        "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
        "parentSessionID is '%s'",
        ids.text.c_str());
  }
  if (ids.text.empty()) return std::nullopt;
  return std::move(ids.text);
}

const FamilyMember* Families::parentSession(const FamilyMember& member) const {
  if (member.level == 0) return nullptr;
  logDebug("parentSessionForChild: Checking userInfoKey '%s' for session %u", shown(member.key, member.facts),
           member.facts.sessionID);
  const CorrelatedList* list = listHolding(member, "parentSessionForChild");
  if (!list) return nullptr;
  const std::int64_t above = std::int64_t{member.level} - 1;
  const FamilyMember* parent = list->getFirstSessionWithHierarchy(above);
  if (!parent) {
    logInfo("parentSessionForChild: Unable to find session with hierarchy of %lld for userInfoKey '%s'",
            static_cast<long long>(above), shown(member.key, member.facts));
  }
  return parent;
}

const FamilyMember* Families::ancestorWithAggregator(const session::FamilyPlace& place) const {
  if (!place.userInfo || place.hierarchy < 1) return nullptr;
  const auto member = _members.find(&place.aggregation);
  const bool told = member != _members.end() && member->second.facts.userInfo == place.userInfo &&
                    std::string_view(member->second.home->first) == member->second.key;
  const CorrelatedList* family =
      told ? &member->second.home->second : list(userInfoKeyForUserInfo(place.userInfo.get()));
  return family ? family->topmostAggregator(place.hierarchy) : nullptr;
}

bool Families::ancestorAggregates(const session::FamilyPlace& place) {
  const Lock held(_lock);
  return ancestorWithAggregator(place) != nullptr;
}

session::CopySent Families::sendToAncestor(const session::FamilyPlace& place, std::string_view copy) {
  const Lock held(_lock);
  const FamilyMember* ancestor = ancestorWithAggregator(place);
  return ancestor ? ancestor->facts.aggregation->sendToAggregator(copy, ancestor->facts.sessionIDString)
                  : session::CopySent();
}

void Families::updateCombinedSessionID(const FamilyMember& member) const {
  const auto ancestors = parentSessionIDString(member);
  if (!ancestors) return;
  const std::string combined = *ancestors + "." + member.facts.sessionIDString;
  logDebug("updateCombinedSessionID: Updating combined session ID '%s' for session %u backends",
           combined.c_str(), member.facts.sessionID);
  if (!member.facts.backends) return;
  for (const auto& [name, backend] : *member.facts.backends) backend->setCorrelatedSessionID(combined);
}

void Families::syncReportingStates(const FamilyMember& member) const {
  const FamilyMember* parent = parentSession(member);
  if (!member.facts.backends) return;
  if (parent) return session::syncReportingStates(*member.facts.backends, parent->facts.backends.get());
  for (const auto& [name, backend] : *member.facts.backends) {
    if (backend->hierarchy() < 1) continue;
    logInfo("syncReportingStates: child session %u (backend %s) with hierarchy %d is missing its parent",
            member.facts.sessionID, backend->name().c_str(), backend->hierarchy());
  }
}

void Families::updateDownstreamSessions(session::FamilyFacts facts) {
  std::string key = userInfoKeyForUserInfo(facts.userInfo.get());
  const std::uint32_t sessionID = facts.sessionID;
  const bool identified = facts.userInfo != nullptr;
  platform::LateErrors late;
  const Lock held(_lock);
  const auto at = _members.find(facts.aggregation.get());
  if (at != _members.end()) {
    tell(at->second, facts, key);
    at->second.home->second.refreshLevel(at->second);
  }
  if (!identified) {
    logInfo("updateDownstreamSessions: No user info found for session %u", sessionID);
  } else if (at != _members.end()) {
    refresh(at->second, late.lines);
  }
}

void Families::refresh(FamilyMember& member, std::vector<std::string>& lines) {
  const auto shutDown = [&lines](const FamilyMember& ending) {
    const session::FamilyFacts& facts = ending.facts;
    if (auto line = facts.aggregation->shutdownSessionAggregation(facts.sessionID)) {
      lines.push_back(std::move(*line));
    }
  };
  const CorrelatedList& list = member.home->second;
  updateCombinedSessionID(member);
  syncReportingStates(member);
  const bool ancestorAggregates = list.topmostAggregator(member.level) != nullptr;
  if (ancestorAggregates) shutDown(member);
  for (const FamilyMember* below : list.below(member.level)) {
    logDebug(
        "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session %u",
        below->facts.sessionID);
    updateCombinedSessionID(*below);
    syncReportingStates(*below);
    const bool above = member.facts.aggregation->active() || ancestorAggregates;
    if (above && below->facts.aggregation->active()) shutDown(*below);
  }
}

}  // namespace veltrad::daemon
