// The key under which sessions of one identity meet. A plain function; any thread.
#pragma once

#include <string>

#include "base/value.h"

namespace veltrad::daemon {

// The lower-cased client name, ":", the lower-cased service name; what is missing counts as empty text.
std::string userInfoKeyForUserInfo(const Dictionary* userInfo);

}  // namespace veltrad::daemon
