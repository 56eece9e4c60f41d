// SPDX-License-Identifier: Apache-2.0
// Answers the calls of a connection to the control socket. The connection's own thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::ipc {

class PendingReply;

class Observer {
 public:
  virtual ~Observer() = default;
  // Answers the call, now or later; `reply` is null if none is wanted. If a text is returned, nothing was
  // run, and the text says in one sentence what is wrong with the call.
  virtual std::optional<std::string> ask(const std::string& operation, Dictionary arguments,
                                         std::shared_ptr<PendingReply> reply) = 0;
};

}  // namespace veltrad::ipc
