// SPDX-License-Identifier: Apache-2.0
// The operations of a session, and their names in lines and answers.
#pragma once

#include <cstddef>
#include <iterator>

namespace veltrad::ctl {

enum class Operation {
  start,
  send,
  oneShot,
  flush,
  states,
  displayURL,
  uploadFile,
  uploadLogData,
  restart,
  sleep,
  finish
};

inline constexpr const char* kOperationNames[] = {"start",   "send",       "oneShot",    "flush",
                                                  "states",  "displayURL", "uploadFile", "uploadLogData",
                                                  "restart", "sleep",      "finish"};
static_assert(std::size(kOperationNames) == static_cast<std::size_t>(Operation::finish) + 1);

// The "op" of a line and of its answer.
constexpr const char* operationName(Operation operation) {
  return kOperationNames[static_cast<std::size_t>(operation)];
}

}  // namespace veltrad::ctl
