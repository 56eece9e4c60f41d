// SPDX-License-Identifier: Apache-2.0
// What the owner of the device asks for: reporting off and on, other identifiers, and what there is to know
// of what leaves. Any thread.
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

  // What it takes outlives it; `spool` may be null.
  Privacy(Services& services, VeltradAgent& agent, backends::BackendFactory& factory,
          const support::Veltra& library, backends::PostSpool* spool)
      : _services(services), _agent(agent), _factory(factory), _library(library), _spool(spool) {}

  // Reads the owner's word again and, if it has changed, stops what may not leave any more. Main thread,
  // several times a second.
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
  // Returns how many posts that were.
  std::size_t emptySpool(wire::Reason why);
  const char* reporting() const;
  Result<Array, std::string> identifiers();
  Dictionary onDisk() const;

  Services& _services;
  VeltradAgent& _agent;
  backends::BackendFactory& _factory;
  const support::Veltra& _library;
  backends::PostSpool* const _spool;

  // One at a time hears the owner.
  Mutex _mutex OWNER_LOCK;
  // The word has changed, and requests that had begun have been given until the next call.
  bool _graceRuns GUARDED_BY(_mutex) = false;
  // The word has changed, and not everybody was told.
  bool _toBeTold GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::daemon
