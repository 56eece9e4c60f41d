// SPDX-License-Identifier: Apache-2.0
// Reports the transaction as the service manager's STATUS text.
#include "platform/transaction.h"

#include <cstdlib>

#include "platform/service_manager.h"

namespace veltrad::platform {

void ServiceTransaction::open() {
  if (_isOpen.exchange(true)) std::abort();
  _manager.status("Serving sessions");
}

void ServiceTransaction::close() {
  if (!_isOpen.exchange(false)) std::abort();
  _manager.status("Idle: no sessions");
}

}  // namespace veltrad::platform
