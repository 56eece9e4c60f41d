// What a session reports of itself at its start. A plain function; any thread.
#pragma once

#include "base/value.h"

namespace veltrad {

class DeviceIdentity;
class Veltra;
namespace platform {
class Locale;
class Preferences;
}  // namespace platform

// Internal release: "SerialNum", "Version", "Build", "Hardware", "Product" ("Unknown" where there is no
// value), "ReportVers", "Locale", "AutomaticTimeSet". Every other release: the last two alone. "Locale" is
// left out where the locale names no country.
Dictionary startMessagePayload(DeviceIdentity& device, const Veltra& library,
                               platform::Preferences& preferences, platform::Locale& locale);

}  // namespace veltrad
