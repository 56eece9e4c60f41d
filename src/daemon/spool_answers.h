// SPDX-License-Identifier: Apache-2.0
// What those who look after the device are answered about the spool. The asking thread. The spool may be
// null.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::backends {
class PostSpool;
}  // namespace veltrad::backends

namespace veltrad::daemon {

// {"posts", "bytes", "oldest", "addresses": [{"address", "posts", "bytes", "oldest", "nextTry",
// "lastError"}]}; not a number without a spool. What is not known is not a number, too.
Value statusOfSpool(backends::PostSpool* spool);

// {"posts": [what is kept, and its tries], "next": "after" of the next question, where there is more}.
// `arguments`: {"after"}, 0 or absent for the first.
Result<Dictionary, std::string> spoolPage(backends::PostSpool* spool, const Dictionary& arguments);
// {"posts": how many leave now}.
Result<Dictionary, std::string> sendSpool(backends::PostSpool* spool);
// {"posts": how many were removed}. `arguments`: {"ids"}; if one is unknown, none is removed.
Result<Dictionary, std::string> dropFromSpool(backends::PostSpool* spool, const Dictionary& arguments);

}  // namespace veltrad::daemon
