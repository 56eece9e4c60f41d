// SPDX-License-Identifier: Apache-2.0
// Answers the questions about the spool on the control socket. The caller's thread. The spool may be null.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::backends {
class PostSpool;
}  // namespace veltrad::backends

namespace veltrad::daemon {

// {"posts", "bytes", "oldest", "addresses": [{"address", "posts", "bytes", "oldest", "nextTry",
// "lastError"}]}; NaN without a spool. Unknown values are NaN.
Value statusOfSpool(backends::PostSpool* spool);

// {"posts": [what is kept, and its tries], "next": "after" of the next question, where there is more}.
// `arguments`: {"after"}, 0 or absent for the first.
Result<Dictionary, std::string> spoolPage(backends::PostSpool* spool, const Dictionary& arguments);
// {"posts": how many leave now}.
Result<Dictionary, std::string> sendSpool(backends::PostSpool* spool);
// {"posts": how many were removed}. `arguments`: {"ids"}; if one is unknown, none is removed.
Result<Dictionary, std::string> dropFromSpool(backends::PostSpool* spool, const Dictionary& arguments);

}  // namespace veltrad::daemon
