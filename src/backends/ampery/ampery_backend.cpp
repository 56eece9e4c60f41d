// SPDX-License-Identifier: Apache-2.0
// Turns a message into an event of the energy log.
#include "backends/ampery/ampery_backend.h"

#include "backends/ampery/energy_log.h"
#include "platform/counters.h"

namespace veltrad::backends {

namespace {
constexpr std::uint32_t kEnergyLogClient = 28;
constexpr const char* kEnergyLogEvent = "Sonvaird-VLT";
}  // namespace

std::shared_ptr<AmperyBackend> AmperyBackend::initWithName(EnergyLog& energyLog, platform::Counters& counters,
                                                           platform::Random& random, const std::string& name,
                                                           const std::string& productFamily) {
  return std::shared_ptr<AmperyBackend>(new AmperyBackend(energyLog, counters, random, name, productFamily));
}

AmperyBackend::AmperyBackend(EnergyLog& energyLog, platform::Counters& counters, platform::Random& random,
                             const std::string& name, const std::string& productFamily)
    : VeltraBackend(name, productFamily, random), _energyLog(energyLog), _counters(counters) {}

Sent AmperyBackend::sendNumberedMessage(NumberedMessage&& message) {
  if (const auto forbidden = prohibition()) {
    _counters.count(wire::Reason::backend_disabled);
    return settled(message, {wire::Fate::dropped, *forbidden});
  }
  if (message.method == 0 || !message.payload || message.payload->empty()) {
    const wire::Reason why =
        message.method == 0 ? wire::Reason::energy_category_zero : wire::Reason::energy_payload_empty;
    _counters.count(why);
    return settled(message, {wire::Fate::none, why});
  }
  Dictionary event = *std::move(message.payload);
  event.merge({{"event", unsigned{message.eventID}},
               {"method", unsigned{message.method}},
               {"respCode", unsigned{message.respCode}}});
  if (!_energyLog.logRegisteredEvent(kEnergyLogClient, kEnergyLogEvent, event)) {
    return settled(message, {wire::Fate::dropped, wire::Reason::energy_log_failed});
  }
  return settled(message, {wire::Fate::written, wire::Reason::always});
}

}  // namespace veltrad::backends
