// The energy log's back end. The session's thread.
#include "backends/ampery/ampery_backend.h"

#include "backends/ampery/energy_log.h"
#include "platform/counters.h"

namespace veltrad::backends {

namespace {
constexpr std::uint32_t kEnergyLogClient = 28;
constexpr const char* kEnergyLogEvent = "Sonvaird-VLT";
}  // namespace

std::shared_ptr<AmperyBackend> AmperyBackend::initWithName(const BackendServices& services,
                                                           const std::string& name,
                                                           const std::string& productFamily) {
  return std::shared_ptr<AmperyBackend>(new AmperyBackend(services, name, productFamily));
}

AmperyBackend::AmperyBackend(const BackendServices& services, const std::string& name,
                             const std::string& productFamily)
    : VeltraBackend(name, productFamily, services.random),
      _energyLog(services.energyLog),
      _counters(services.counters) {}

std::optional<std::string> AmperyBackend::sendMessage(const Dictionary* payload, platform::TimeValue,
                                                      std::uint16_t method, std::uint16_t respCode,
                                                      std::uint16_t eventID, std::int32_t) {
  if (method == 0 || !payload || payload->empty()) {
    _counters.count(method == 0 ? wire::Reason::energy_category_zero : wire::Reason::energy_payload_empty);
    return std::nullopt;
  }
  Dictionary event = *payload;
  event.merge({{"event", unsigned{eventID}}, {"method", unsigned{method}}, {"respCode", unsigned{respCode}}});
  _energyLog.logRegisteredEvent(kEnergyLogClient, kEnergyLogEvent, event);
  return std::nullopt;
}

}  // namespace veltrad::backends
