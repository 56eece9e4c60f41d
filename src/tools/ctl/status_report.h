// SPDX-License-Identifier: Apache-2.0
// The running daemon's status, for programs and for people. Pure functions.
#pragma once

#include <string>

#include "base/value.h"

namespace veltrad::ctl {

// The sessions of all replies to "sessions", in order, as a tree: each is under its parent's "children", and
// "id" and "parent" are gone.
Array treeOfSessions(Array listed);

// `status`: {"daemon", "sessions", "storebags", "servers"}, as --json prints it. `now`: seconds since 1970.
// No line break at the end.
std::string formatStatus(const Dictionary& status, double now);

// "45 s", "12 min", "3 h 20 min", "5 d 2 h"
std::string formatDuration(double seconds);

}  // namespace veltrad::ctl
