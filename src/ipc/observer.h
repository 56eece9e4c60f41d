// SPDX-License-Identifier: Apache-2.0
// What a connection to the control socket is answered by. The connection's own thread.
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
  // Answers the call, now or later; `reply` is null where none is wanted. Nothing ran if text comes back: it
  // says in one sentence what is wrong with the call.
  virtual std::optional<std::string> ask(const std::string& operation, Dictionary arguments,
                                         std::shared_ptr<PendingReply> reply) = 0;
};

}  // namespace veltrad::ipc
