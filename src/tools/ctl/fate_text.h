// SPDX-License-Identifier: Apache-2.0
// The fates of messages as readable text. Pure functions.
#pragma once

#include <string>

#include "support/fate_book.h"

namespace veltrad::ctl {

// One block, without a line break at the end.
std::string textOfFates(const support::MessageFates& fates);
// "10:04:05.123 message 7 from …"
std::string textOfMessage(const support::ToldMessage& message);
// "10:04:05.123 httppost: posted to …"; `backend` may be empty.
std::string textOfStep(const support::ToldStep& step, std::string_view backend);
// In the local time zone.
std::string timeOf(std::int64_t microseconds);

}  // namespace veltrad::ctl
