// SPDX-License-Identifier: Apache-2.0
// Serves the owner of the device: turns reporting off and on, resets identifiers, and shows what may leave
// and what left. Any thread.
#pragma once

#include <chrono>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "daemon/lock_ranks.h"
#include "daemon/services.h"

namespace veltrad::backends {
class BackendFactory;
class PostSpool;
}  // namespace veltrad::backends

namespace veltrad::support {
class Veltra;
}  // namespace veltrad::support

namespace veltrad::daemon {

class VeltradAgent;

// Answers as the control socket carries them, or one line that says what is wrong.
class Privacy {
 public:
  using Answer = Result<Dictionary, std::string>;

  // The constructor's arguments must outlive it; `spool` may be null.
  Privacy(Services& services, VeltradAgent& agent, backends::BackendFactory& factory,
          const support::Veltra& library, backends::PostSpool* spool)
      : _services(services), _agent(agent), _factory(factory), _library(library), _spool(spool) {}

  // Reads the owner's decision again and, if it has changed, stops everything that may no longer leave. Main
  // thread, several times a second.
  void hearOwner();

  // {"reporting": "on" or "off", "consent": boolean, or not a number where it was never asked for, "policy":
  // the keys of policy.json, "broken", or not a number without the file, "identifiers", "destinations"}.
  Answer show();
  // {"reporting": "off", "dropped", "underWay", "onDisk"}.
  Answer turnOff();
  // {"reporting"}, which is "off" if the policy still says so.
  Answer turnOn();
  // {"identifiers"}: as in show().
  Answer resetIdentifiers();

 private:
  bool obey() REQUIRES(_mutex);
  // Empties the spool, if there is one. Returns the number of posts.
  std::size_t emptySpool(wire::Reason why);
  const char* reporting() const;
  Result<Array, std::string> identifiers();
  Dictionary onDisk() const;

  Services& _services;
  VeltradAgent& _agent;
  backends::BackendFactory& _factory;
  const support::Veltra& _library;
  backends::PostSpool* const _spool;

  // Allows one refresh of the owner's decision at a time.
  Mutex _mutex OWNER_LOCK;
  // The decision has changed, and requests that have begun may run until the next call.
  bool _graceRuns GUARDED_BY(_mutex) = false;
  // The decision has changed, and not all back ends were told.
  bool _toBeTold GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::daemon
