// SPDX-License-Identifier: Apache-2.0
// `veltractl refresh`: fetches one storebag now. The caller's thread, which waits for the server.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::daemon {

class StorebagCache;

// {"name", "result": "fetched" | "refused" | "failed", "signature": "good" | "bad", "reason", "version"}.
// refused: the server gave something that is not used; failed: it gave nothing. "version" is that of the
// storebag in use afterwards. Missing values are NaN. Fails for a name that no client type has, with one line
// that lists the names.
Result<Dictionary, std::string> refreshStorebag(StorebagCache& cache, const std::string& name);

}  // namespace veltrad::daemon
