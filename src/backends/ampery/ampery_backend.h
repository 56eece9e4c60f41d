// AmperyBackend: every message with a method and a payload is one registered event of the energy log. The
// session's thread.
#pragma once

#include <memory>
#include <string>

#include "backends/backend.h"
#include "backends/backend_factory.h"

namespace veltrad::backends {

// Reads nothing of its section. The energy log outlives it.
class AmperyBackend final : public VeltraBackend {
 public:
  static std::shared_ptr<AmperyBackend> initWithName(const BackendServices& services, const std::string& name,
                                                     const std::string& productFamily);

  using VeltraBackend::sendMessage;
  // Nothing, always. The event is the payload, with "method", "respCode" and "event" (the event ID) set.
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID,
                                         std::int32_t flag) override;

 private:
  AmperyBackend(const BackendServices& services, const std::string& name, const std::string& productFamily);

  // Constant after construction.
  EnergyLog& _energyLog;
  platform::Counters& _counters;
};

}  // namespace veltrad::backends
