// SPDX-License-Identifier: Apache-2.0
// The payload of the message that a session sends at its start.
#pragma once

#include "base/value.h"
#include "platform/locale.h"
#include "platform/preferences.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad::session {

// On internal releases: "SerialNum", "Version", "Build", "Hardware", "Product" ("Unknown" for a missing
// value), "ReportVers", "Locale" and "AutomaticTimeSet"; on others only the last two. "Locale" is left out if
// the locale has no country.
Dictionary startMessagePayload(support::DeviceIdentity& device, const support::Veltra& library,
                               platform::Preferences& preferences, platform::Locale& locale);

}  // namespace veltrad::session
