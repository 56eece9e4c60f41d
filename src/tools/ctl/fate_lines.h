// SPDX-License-Identifier: Apache-2.0
// What became of messages, for programs. Pure functions.
#pragma once

#include "base/null_value.h"
#include "support/fate_book.h"

namespace veltrad::ctl {

// What is known of a message itself; null stands for what is not.
Dictionary lineOfMessage(const support::ToldMessage& message);
// The same with its back ends and their roads.
Dictionary lineOfFates(const support::MessageFates& fates);
// "time", "step" and what else is known of a step.
Dictionary lineOfStep(const support::ToldStep& step);
// Seconds since 1970.
double secondsOf(std::int64_t time);

}  // namespace veltrad::ctl
