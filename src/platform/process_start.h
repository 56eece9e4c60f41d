// SPDX-License-Identifier: Apache-2.0
// Prepares the daemon's process and guards its end. Main thread, before any other thread exists.
#pragma once

#include <optional>
#include <string_view>

namespace veltrad::platform {

// Opens /dev/null for each closed descriptor from 0 to 2, because the next opened file would get that number.
void openStandardDescriptors();

// Removes all other environment variables, because libraries read theirs at any time and some load code.
void keepEnvironment(std::initializer_list<std::string_view> names);

// Until allowExit(), exit() and quick_exit() end the process with status 1 and one error line, whoever calls
// them. _exit() and signals are not affected.
void forbidExit();
// To be called after code was loaded, so that the guard runs before the handlers that this code registered.
// Does nothing while exits are allowed.
void renewExitGuard();
void allowExit();

}  // namespace veltrad::platform
