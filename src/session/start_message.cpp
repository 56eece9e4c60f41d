// SPDX-License-Identifier: Apache-2.0
// Makes the payload of the start message.
#include "session/start_message.h"

#include "config/preference_keys.h"

namespace veltrad::session {

Dictionary startMessagePayload(support::DeviceIdentity& device, const support::Veltra& library,
                               platform::Preferences& preferences, platform::Locale& locale) {
  const auto automatic =
      preferences.value(config::preference::kTimeDomain, config::preference::kAutomaticTimeZone);
  Dictionary payload{{"AutomaticTimeSet", automatic ? automatic->toBoolean().value_or(true) : true}};
  payload.setIfPresent("Locale", locale.countryCode());
  if (!device.isInternalBuild()) return payload;

  const auto orUnknown = [](const std::optional<std::string>& fact) {
    return fact ? *fact : std::string("Unknown");
  };
  payload.merge({{"Build", orUnknown(device.deviceBuildVersion())},
                 {"Hardware", orUnknown(device.deviceHardwareModel())},
                 {"Product", orUnknown(device.deviceName())},
                 {"ReportVers", library.packageVersion()},
                 {"SerialNum", orUnknown(device.deviceSerialNumber())},
                 {"Version", orUnknown(device.deviceProductVersion())}});
  return payload;
}

}  // namespace veltrad::session
