// SPDX-License-Identifier: Apache-2.0
// Caches the reply to a message for the next message.
#pragma once

#include <cstdint>
#include <string>

#include "base/value.h"
#include "wire/fates.h"

namespace veltrad::ipc {

// Most messages of a session have the same outcomes as the one before, so their replies differ only in the
// call ID. The last frame is kept, so that such a reply costs a comparison. The owner guards it.
class SentFrame {
 public:
  // The frame of a reply without a text; valid until the next call.
  const std::string& of(std::uint32_t callID, const wire::Outcomes& outcomes);

  static Dictionary resultsOf(const wire::Outcomes& outcomes);

 private:
  wire::Outcomes _outcomes;
  // Empty before the first call.
  std::string _frame;
};

}  // namespace veltrad::ipc
