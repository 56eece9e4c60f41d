// SPDX-License-Identifier: Apache-2.0
// Charges the session info and the user info that a client sends to its user.
#pragma once

#include <memory>

#include "backends/session_facts.h"
#include "base/value.h"

namespace veltrad::session {

// Returns the dictionary, charged to `account` (which may be null) as long as it is referenced. Null if the
// user would keep too much, even without its batches. Called without a lock.
backends::SharedDictionary keptInfo(Dictionary info, const std::shared_ptr<platform::MemoryAccount>& account);

// Whether both name the same client and service. A name that is missing counts as a change.
bool sameClient(const Dictionary& current, const Dictionary& updated);

}  // namespace veltrad::session
