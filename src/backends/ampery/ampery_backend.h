// SPDX-License-Identifier: Apache-2.0
// AmperyBackend: writes every message that has a method and a payload to the energy log. The session's
// thread.
#pragma once

#include <memory>
#include <string>

#include "backends/backend.h"

namespace veltrad::backends {

class EnergyLog;

// Does not read its section. The energy log must outlive it.
class AmperyBackend final : public VeltraBackend {
 public:
  static std::shared_ptr<AmperyBackend> initWithName(EnergyLog& energyLog, platform::Counters& counters,
                                                     platform::Random& random, const std::string& name,
                                                     const std::string& productFamily);

  // The event is the payload with "method", "respCode" and "event" (the event ID) set. Returns no text.
  Sent sendNumberedMessage(NumberedMessage&& message) override;

 private:
  AmperyBackend(EnergyLog& energyLog, platform::Counters& counters, platform::Random& random,
                const std::string& name, const std::string& productFamily);

  EnergyLog& _energyLog;
  platform::Counters& _counters;
};

}  // namespace veltrad::backends
