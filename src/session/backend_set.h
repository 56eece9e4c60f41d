// The backends of one session, made from a storebag section. Plain functions; the session's thread, but for
// what a family does.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "base/value.h"

namespace veltrad::backends {
class BackendFactory;
}  // namespace veltrad::backends

namespace veltrad::config {
struct StorebagSection;
}  // namespace veltrad::config

namespace veltrad::platform {
class Clock;
class MemoryAccount;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
class Veltra;
}  // namespace veltrad::support

namespace veltrad::session {

// By name; the order of the names' bytes is the order in which backends are asked.
using BackendSet = std::map<std::string, std::shared_ptr<backends::VeltraBackend>, std::less<>>;

struct BackendMaking {
  backends::BackendFactory& factory;
  support::DeviceIdentity& device;
  const support::Veltra& library;
  platform::Clock& clock;
  std::shared_ptr<platform::MemoryAccount> account = nullptr;
  bool oneShot = false;
};

// One backend for each entry of the section that the factory knows; an empty set when it knows none. Null,
// with one error line, without a storebag or without session info. `facts` has the user info, the device's
// identifier and the session's ID, where it has one; the rest is found out here.
std::shared_ptr<const BackendSet> createBackends(const BackendMaking& making,
                                                 const config::StorebagSection* storebag,
                                                 const Dictionary* sessionInfo, backends::SessionFacts facts);

// The names of those in state 2 or 3.
std::vector<std::string> reportingNames(const BackendSet& backends);

// The number that the HTTPS post backend takes from its client entry; 0, a root, also without one. Any
// thread.
std::int32_t hierarchyOf(const BackendSet* backends);

// Takes over the states and sampling thresholds of the parent session's back ends, one by one; one in state 3
// keeps its own, one that the parent lacks is disabled. Any thread, one at a time for all sessions of a
// family.
void syncReportingStates(const BackendSet& backends, const BackendSet* parents);

}  // namespace veltrad::session
