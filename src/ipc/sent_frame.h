// SPDX-License-Identifier: Apache-2.0
// The reply to a message, as it is kept for the next one.
#pragma once

#include <cstdint>
#include <string>

#include "base/value.h"
#include "wire/fates.h"

namespace veltrad::ipc {

// Most messages of a session have the outcomes of the one before, so that their replies differ in the call ID
// alone; the last frame is kept, which makes such a reply cost a comparison. The owner guards it.
class SentFrame {
 public:
  // Of a reply without a text; valid until the next call.
  const std::string& of(std::uint32_t callID, const wire::Outcomes& outcomes);

  static Dictionary resultsOf(const wire::Outcomes& outcomes);

 private:
  wire::Outcomes _outcomes;
  // Empty before the first call.
  std::string _frame;
};

}  // namespace veltrad::ipc
