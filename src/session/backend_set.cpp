// SPDX-License-Identifier: Apache-2.0
// Makes the back ends of a session and reads their states.
#include "session/backend_set.h"

#include <utility>

#include "base/null_value.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::session {

namespace {
// The back end of this name; null: there is none.
backends::VeltraBackend* named(const BackendSet* set, const std::string& name) {
  const auto at = set ? set->find(name) : BackendSet::const_iterator();
  return set && at != set->end() ? at->second.get() : nullptr;
}

// Completes the facts that the back ends of one session share.
void complete(backends::SessionFacts& facts, const BackendMaking& making,
              const config::StorebagOrigin& origin, const Dictionary& sessionInfo) {
  facts.startTimeStamp = making.before && !making.before->empty()
                             ? making.before->begin()->second->facts()->startTimeStamp
                             : platform::timevalToSeconds(making.clock.now());
  facts.device.productVersion = making.device.deviceProductVersion();
  facts.device.buildVersion = making.device.deviceBuildVersion();
  facts.device.hardwareType = making.device.deviceProductType();
  facts.device.isInternal = making.device.isInternalBuild();
  facts.selfVersion = backends::SelfVersion::of(making.library.packageVersion());
  facts.sessionID = sessionInfo.uint32(wire::kVeltraSessionInfoSessionID).value_or(0);
  facts.compType = sessionInfo.int32(wire::kVeltraSessionInfoClientType).value_or(0);
  facts.clientVersion = sessionInfo.uint16(wire::kVeltraSessionInfoClientVersion).value_or(0);
  facts.requireUserInfo = sessionInfo.boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false);
  facts.batchEvents = sessionInfo.boolean(wire::kVeltraSessionInfoBatchEvent).value_or(false);
  facts.account = making.account;
  facts.client = backends::clientOf(facts);
  facts.storebag = std::make_shared<const Dictionary>(
      Dictionary{{"name", origin.name}, {"version", orNull(origin.version)}, {"section", origin.section}});
}
}  // namespace

std::shared_ptr<const BackendSet> createBackends(const BackendMaking& making,
                                                 const config::StorebagSection* storebag,
                                                 const Dictionary* sessionInfo,
                                                 backends::SessionFacts facts) {
  if (!storebag) {
    logError("createBackends: Attempted to create backends with nil storebag");
    return nullptr;
  }
  if (!sessionInfo) {
    logError("createBackends: Attempted to create backends with nil session info");
    return nullptr;
  }
  const auto productFamily = making.device.deviceName();
  complete(facts, making, storebag->origin, *sessionInfo);
  const auto shared = std::make_shared<const backends::SessionFacts>(std::move(facts));
  auto made = std::make_shared<BackendSet>();
  const auto notMade = [&making](const std::string& name, wire::Reason why) {
    if (making.notMade) making.notMade->emplace_back(name, why);
  };
  for (const auto& [name, profile] : storebag->backends) {
    if (!making.decision.policy->makes(name)) {
      making.counters.count(wire::Reason::policy_backends);
      notMade(name, wire::Reason::policy_backends);
      continue;
    }
    backends::VeltraBackend* before = named(making.before, name);
    auto backend =
        making.factory.newBackendWithName(name, profile, productFamily, shared, making.oneShot,
                                          before ? std::optional(before->samplingFactor()) : std::nullopt);
    if (!backend) {
      notMade(name, backends::BackendFactory::whyNotMade(name));
      continue;
    }
    if (backend->hostsAreFixed() &&
        making.decision.refusalFor(name, backend->hosts()) == wire::Reason::policy_hosts) {
      making.counters.count(wire::Reason::policy_hosts);
      notMade(name, wire::Reason::policy_hosts);
      backend->cleanup();
      continue;
    }
    if (before) backend->takeOver(*before);
    made->emplace(name, std::move(backend));
  }
  return made;
}

void updateStates(const BackendSet* backends) {
  if (!backends) return;
  for (const auto& [name, backend] : *backends) backend->updateState();
}

void cleanUp(const BackendSet* backends) {
  if (!backends) return;
  for (const auto& [name, backend] : *backends) backend->cleanup();
}

void applyProhibitions(const BackendSet& backends, const config::OwnerDecision& decision) {
  for (const auto& [name, backend] : backends) {
    backend->setProhibition(decision.refusalFor(name, backend->hosts()));
  }
}

std::vector<std::string> reportingNames(const BackendSet& backends) {
  std::vector<std::string> names;
  for (const auto& [name, backend] : backends) {
    const std::int32_t state = backend->state();
    if (state == backends::kBackendReporting || state == backends::kBackendHeld)
      names.push_back(backend->name());
  }
  return names;
}

std::int32_t hierarchyOf(const BackendSet* backends) {
  if (!backends) return 0;
  std::int32_t hierarchy = 0;
  // A set has few back ends, and comparing lengths first is faster than searching for names.
  for (const auto& [name, backend] : *backends) {
    if (name == std::string_view(wire::kVeltraBackendHTTPPost2)) return backend->hierarchy();
    if (name == std::string_view(wire::kVeltraBackendHTTPPost)) hierarchy = backend->hierarchy();
  }
  return hierarchy;
}

std::optional<std::string> displayURLOf(const BackendSet* backends) {
  if (!backends) return std::nullopt;
  for (const char* name :
       {wire::kVeltraBackendHTTPPost, wire::kVeltraBackendHTTPPost2, wire::kVeltraBackendDashboard}) {
    const auto at = backends->find(name);
    if (at != backends->end() && at->second->displayURL()) return at->second->displayURL();
  }
  return std::nullopt;
}

void syncReportingStates(const BackendSet& backends, const BackendSet* parents) {
  for (const auto& [name, backend] : backends) {
    if (backend->ownVerdict().state == backends::kBackendHeld) continue;
    const auto at = parents ? parents->find(name) : BackendSet::const_iterator();
    if (!parents || at == parents->end()) {
      backend->setState({backends::kBackendDisabled, wire::Reason::parent_has_none});
      continue;
    }
    backends::StateVerdict verdict = at->second->ownVerdict();
    if (verdict.state == backends::kBackendDisabled) verdict.reason = wire::Reason::parent_state;
    backend->setState(verdict);
    backend->setSamplingThreshold(at->second->samplingThreshold());
    logDebug("HTTPSPostBackend(syncReportingStates): %s: state and sampling rate updated to %d, %.02f%%",
             backend->name().c_str(), backend->state(), backend->samplingThreshold().value_or(0));
  }
}

}  // namespace veltrad::session
