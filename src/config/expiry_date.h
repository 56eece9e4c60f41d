// SPDX-License-Identifier: Apache-2.0
// The date until which a storebag may be used. A plain function; any thread.
#pragma once

#include <optional>
#include <string_view>

namespace veltrad::config {

// The first moment at which it has expired, in seconds since 1970: of a date ("2026-12-31") the end of that
// day in UTC; of a date and time as RFC 3339 writes it ("2026-12-31T18:00:00Z", "…T19:00:00.5+01:00") that
// moment. Absent for any other text, for days that no calendar has and for years outside 1970 to 9999.
std::optional<double> expiryOf(std::string_view text);

}  // namespace veltrad::config
