// What a session is told of itself and keeps. Plain functions; any thread.
#pragma once

#include <memory>

#include "backends/backend.h"
#include "base/value.h"

namespace veltrad::session {

// The dictionary, charged to `account` (null: to nobody) for as long as anybody holds it, with what is kept
// of its names elsewhere. Null: the user keeps too much, even without what its batches hold. No lock may be
// held.
backends::SharedDictionary keptInfo(Dictionary info, const std::shared_ptr<platform::MemoryAccount>& account);

}  // namespace veltrad::session
