// SPDX-License-Identifier: Apache-2.0
// Answers questions about the history on the control socket. Any thread.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::support {
class History;
}  // namespace veltrad::support

namespace veltrad::daemon {

// A page of its records, oldest first. `arguments`: {"day", "offset"}, as "next" of the page before; without
// them, the first page. {"records": [the record, with "day" and "offset"], "next": {"day", "offset"}},
// without "next" at the end.
Result<Dictionary, std::string> historyPage(support::History& history, const Dictionary& arguments);
// Bytes of a body. {"day", "offset"} of its record, {"from"} in the body. {"bytes", "size": of the body}.
Result<Dictionary, std::string> historyBody(support::History& history, const Dictionary& arguments);
// {"records", "bytes", "days"}: what was removed.
Result<Dictionary, std::string> purgeHistory(support::History& history);

}  // namespace veltrad::daemon
