// SPDX-License-Identifier: Apache-2.0
// The back ends of one session, made from a storebag section.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "base/value.h"
#include "config/owner_gate.h"
#include "config/storebag_content.h"
#include "platform/clock.h"
#include "platform/memory_budget.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad::session {

// By name. Back ends are called in the order of their names' bytes.
using BackendSet = std::map<std::string, std::shared_ptr<backends::VeltraBackend>, std::less<>>;

// Back ends of a section that were not made, and why.
using NotMade = std::vector<std::pair<std::string, wire::Reason>>;

struct BackendMaking {
  backends::BackendFactory& factory;
  support::DeviceIdentity& device;
  const support::Veltra& library;
  platform::Clock& clock;
  platform::Counters& counters;
  const config::OwnerDecision& decision;
  std::shared_ptr<platform::MemoryAccount> account = nullptr;
  bool oneShot = false;
  // Receives the back ends that were not made, unless it is null.
  NotMade* notMade = nullptr;
  // The previous back ends, from which the new ones take over by name; may be null.
  const BackendSet* before = nullptr;
};

// Makes a back end for each entry of the section that the factory knows and the owner of the device allows;
// the set may be empty. Null, after one error line, without a storebag or without session info. The caller
// sets the user info, the device's identifier and the combined session ID in `facts`; the other facts are set
// here.
std::shared_ptr<const BackendSet> createBackends(const BackendMaking& making,
                                                 const config::StorebagSection* storebag,
                                                 const Dictionary* sessionInfo, backends::SessionFacts facts);

// Makes each back end decide on its state. The set may be null, here and below.
void updateStates(const BackendSet* backends);

// Called before the session releases the back ends.
void cleanUp(const BackendSet* backends);

// Applies the owner's current decision to the back ends. The session's thread.
void applyProhibitions(const BackendSet& backends, const config::OwnerDecision& decision);

// The names of those that are reporting or held.
std::vector<std::string> reportingNames(const BackendSet& backends);

// The hierarchy number of the HTTPS post back end; 0, which is a root, if there is none. Any thread.
std::int32_t hierarchyOf(const BackendSet* backends);

// The address at which reports can be viewed, if a back end has one.
std::optional<std::string> displayURLOf(const BackendSet* backends);

// Copies the states and sampling thresholds from the parent session's back ends. A held back end keeps its
// own; one that the parent lacks is disabled. Called under the families' lock.
void syncReportingStates(const BackendSet& backends, const BackendSet* parents);

}  // namespace veltrad::session
