// SPDX-License-Identifier: Apache-2.0
// Reads the entitlement rules and applies them to peers.
#include "ipc/entitlements.h"

#include <algorithm>
#include <new>
#include <utility>

#include "platform/log.h"

namespace veltrad::ipc {

namespace {

// Only an integer within the range of IDs.
std::optional<unsigned> idOf(const Value& value) {
  if (value.type() != Value::Type::signedInteger && value.type() != Value::Type::unsignedInteger)
    return std::nullopt;
  const auto number = value.toInt64();
  if (!number || *number < 0 || *number >= 0xffff'ffff) return std::nullopt;
  return static_cast<unsigned>(*number);
}

// A condition of the wrong type never matches: ignoring it would make the rule grant more.
bool matches(const Dictionary& rule, const Peer& peer) {
  const Value* uid = rule.find("uid");
  const Value* gid = rule.find("gid");
  const Value* unit = rule.find("unit");
  if (!uid && !gid && !unit) return false;
  if (uid && idOf(*uid) != peer.uid) return false;
  if (gid) {
    const auto wanted = idOf(*gid);
    if (!wanted || std::find(peer.gids.begin(), peer.gids.end(), *wanted) == peer.gids.end()) return false;
  }
  if (unit) {
    const std::string* wanted = unit->asString();
    if (!wanted || !peer.unit || *wanted != *peer.unit) return false;
  }
  return true;
}

// Says why the rule can never grant anything; absent if it can.
std::optional<std::string> problemOf(const Value& value) {
  const Dictionary* rule = value.asDictionary();
  if (!rule) return "expected a dictionary";
  const Value* uid = rule->find("uid");
  const Value* gid = rule->find("gid");
  const Value* unit = rule->find("unit");
  if (!uid && !gid && !unit) return "expected \"uid\", \"gid\" or \"unit\"";
  if (uid && !idOf(*uid)) return "\"uid\" is no user id, expected an integer";
  if (gid && !idOf(*gid)) return "\"gid\" is no group id, expected an integer";
  if (unit && !unit->asString()) return "\"unit\" is no text, expected a unit's name";
  if (!rule->dictionary("entitlements")) return "expected a dictionary under \"entitlements\"";
  return std::nullopt;
}

struct ReadRules {
  Array rules;
  std::optional<std::string> error;
  std::vector<std::string> warnings;
  bool missing = false;
};

ReadRules rulesIn(const platform::LocalContent& content) {
  using Kind = platform::LocalContent::Kind;
  ReadRules read;
  if (content.warning) read.warnings.push_back(*content.warning);
  read.missing = content.kind == Kind::absent;
  if (read.missing) return read;
  const Array* rules = content.kind == Kind::good ? content.value.asArray() : nullptr;
  if (!rules) {
    read.error = content.kind == Kind::broken
                     ? content.error
                     : content.placeOf({}) + ": the outermost value is not an array of rules";
    return read;
  }
  read.rules = *rules;
  bool namesUnits = false;
  for (std::size_t i = 0; i < rules->size(); ++i) {
    const Value& rule = (*rules)[i];
    if (const auto problem = problemOf(rule)) {
      const std::string number = std::to_string(i);
      read.warnings.push_back(content.placeOf({number}) + ": rule " + number +
                              " grants nothing: " + *problem);
    } else {
      namesUnits = namesUnits || rule.asDictionary()->contains("unit");
    }
  }
  if (namesUnits && !kernelTellsUnits()) {
    read.warnings.push_back(content.path +
                            ": rules with \"unit\" never match, this kernel does not tell a peer's process");
  }
  return read;
}

}  // namespace

std::optional<Value> entitlementInRules(const Array& rules, std::string_view name, const Peer& peer) {
  for (const Value& value : rules) {
    const Dictionary* rule = value.asDictionary();
    if (!rule || !matches(*rule, peer)) continue;
    const Dictionary* entitlements = rule->dictionary("entitlements");
    if (const Value* found = entitlements ? entitlements->find(name) : nullptr) return *found;
  }
  return std::nullopt;
}

bool anybodyIsGranted(const Array& rules, std::string_view name) {
  return std::any_of(rules.begin(), rules.end(), [&](const Value& value) {
    if (problemOf(value)) return false;
    const Value* granted = value.asDictionary()->dictionary("entitlements")->find(name);
    return granted && granted->isBoolean() && *granted->toBoolean();
  });
}

bool mayHoldByRules(const Array& rules, std::string_view name, unsigned uid) {
  return std::any_of(rules.begin(), rules.end(), [&](const Value& value) {
    const Dictionary* rule = value.asDictionary();
    const Value* wanted = rule ? rule->find("uid") : nullptr;
    if (!rule || (wanted && idOf(*wanted) != uid)) return false;
    const Dictionary* entitlements = rule->dictionary("entitlements");
    return entitlements && entitlements->contains(name);
  });
}

Entitlements::Entitlements(platform::FileStore& files, const std::string& path) : _file(files, path) {}

// Lines to log after the lock was released.
struct Entitlements::Said {
  explicit Said(Entitlements& whose) : _whose(whose) {}
  Said(const Said&) = delete;
  ~Said() { _whose.say(*this); }

  std::optional<std::string> error;
  std::optional<std::string> shortage;
  std::vector<std::string> warnings;

 private:
  Entitlements& _whose;
};

void Entitlements::refresh(Said& said) {
  auto now = _file.content();
  if (!now) {
    said.shortage = now.error().description;
    return;
  }
  if (now.value() == _content) return;
  ReadRules fresh = rulesIn(*now.value());
  _state = {fresh.missing, fresh.error.value_or(""), fresh.warnings, false};
  _rules = std::move(fresh.rules);
  _content = std::move(now).value();  // last, so that there is another attempt for want of memory
  said.error = std::move(fresh.error);
  said.warnings = std::move(fresh.warnings);
}

void Entitlements::readAgain() {
  Said said(*this);
  const Lock lock(_mutex);
  _file.readAgain();
  refresh(said);
}

std::optional<Value> Entitlements::valueForEntitlement(std::string_view name, const Peer& peer) {
  Said said(*this);
  const Lock lock(_mutex);
  refresh(said);
  return entitlementInRules(_rules, name, peer);
}

std::optional<RulesState> Entitlements::stateFor(std::string_view name) {
  Said said(*this);
  const Lock lock(_mutex);
  refresh(said);
  if (said.shortage) return std::nullopt;
  RulesState state = _state;
  state.grants = anybodyIsGranted(_rules, name);
  return state;
}

bool Entitlements::mayHold(std::string_view name, unsigned uid) {
  Said said(*this);
  const Lock lock(_mutex);
  refresh(said);
  return mayHoldByRules(_rules, name, uid);
}

void Entitlements::say(const Said& said) {
  if (said.error) logError("Entitlements could not be read, nothing is granted: %s", said.error->c_str());
  for (const std::string& warning : said.warnings) logWarning("Entitlements: %s", warning.c_str());
  if (!said.shortage) return;
  try {
    const auto line = _shortages.happened("Entitlements could not be read just now, the last rules stand: " +
                                          *said.shortage);
    if (line) logWarning("%s", line->c_str());
  } catch (const std::bad_alloc&) {  // said the next time
  }
}

}  // namespace veltrad::ipc
