// The backends of one session, made from a storebag section. Plain functions; the session's thread.
#pragma once

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
// with one error line, without a storebag or without session info. `deviceID` may be empty.
std::shared_ptr<const BackendSet> createBackends(const BackendMaking& making,
                                                 const config::StorebagSection* storebag,
                                                 const Dictionary* sessionInfo,
                                                 const backends::SharedDictionary& userInfo,
                                                 const std::string& deviceID);

// The names of those in state 2 or 3.
std::vector<std::string> reportingNames(const BackendSet& backends);

}  // namespace veltrad::session
