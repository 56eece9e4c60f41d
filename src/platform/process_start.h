// What a daemon's process must be before anything else runs in it, and how alone it may end. Main thread,
// before any other exists.
#pragma once

#include <optional>
#include <string_view>

namespace veltrad::platform {

// Opens /dev/null as each of the descriptors 0 to 2 that the caller has closed: the next file that is opened
// would be taken for one of them.
void openStandardDescriptors();

// Removes every environment variable but those whose names are given: libraries read theirs at any time, and
// some of them load code.
void keepEnvironment(std::initializer_list<std::string_view> names);

// From now on exit() and quick_exit(), whoever calls them, end the process with status 1 and one error line,
// until allowExit(): only an ordered end may have status 0. _exit() and a signal are beyond it.
void forbidExit();
// Once code was loaded, so that the guard runs before what that has registered. Nothing while exits are
// allowed.
void renewExitGuard();
void allowExit();

}  // namespace veltrad::platform
