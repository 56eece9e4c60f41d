// What a session reports of itself at its start. A plain function; any thread.
#pragma once

#include "base/value.h"

namespace veltrad::platform {
class Locale;
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
class Veltra;
}  // namespace veltrad::support

namespace veltrad::session {

// Internal release: "SerialNum", "Version", "Build", "Hardware", "Product" ("Unknown" where there is no
// value), "ReportVers", "Locale", "AutomaticTimeSet". Every other release: the last two alone. "Locale" is
// left out where the locale names no country.
Dictionary startMessagePayload(support::DeviceIdentity& device, const support::Veltra& library,
                               platform::Preferences& preferences, platform::Locale& locale);

}  // namespace veltrad::session
