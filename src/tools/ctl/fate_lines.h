// SPDX-License-Identifier: Apache-2.0
// The fates of messages as JSON, for programs. Pure functions.
#pragma once

#include "base/null_value.h"
#include "support/fate_book.h"

namespace veltrad::ctl {

// The data of a message itself; unknown values are null.
Dictionary lineOfMessage(const support::ToldMessage& message);
// The same with its back ends and their roads.
Dictionary lineOfFates(const support::MessageFates& fates);
// "time", "step" and what else is known of a step.
Dictionary lineOfStep(const support::ToldStep& step);
// Seconds since 1970.
double secondsOf(std::int64_t time);

}  // namespace veltrad::ctl
