// SPDX-License-Identifier: Apache-2.0
// Runs the calls in frames on a session, on the connection's own thread.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "base/result.h"
#include "ipc/observer.h"
#include "ipc/out_queue.h"
#include "platform/memory_budget.h"
#include "wire/client_session_interface.h"
#include "wire/frame.h"

namespace veltrad::ipc {

// A call that has waited this long for its user's memory ends with an error.
inline constexpr std::chrono::seconds kLongestWaitForMemory{60};

// The memory for a call's values, which is charged before they are made.
struct CallMemory {
  // May be null.
  const std::shared_ptr<platform::MemoryAccount>& account;
  // Held until the call has run.
  platform::Charge charge;
  platform::Counters& counters;
  // Writes the replies that were held back; called before the call waits.
  std::function<void()> beforeWait;
  // Returns true if the call must not wait any longer. Called under the accounts' lock, so it takes none.
  std::function<bool()> giveUp;
  // Set if the call was counted and not run because there was no memory.
  bool usedUp = false;
};

// Runs the call in the frame on `session`; its reply goes to `out`. If the frame holds no readable call,
// nothing runs and the result says what is wrong: "unknown operation "x"", "argument "category" must be a
// number". Format: docs/wire-protocol.md. `extensionToken` is the token of the file that was lent with the
// frame, or empty.
std::optional<std::string> dispatchCall(const wire::Frame& frame, wire::ClientSessionInterface& session,
                                        const std::shared_ptr<OutQueue>& out, CallMemory& memory,
                                        const std::string& extensionToken = {});

// The same for a call on the control socket, which `observer` answers.
std::optional<std::string> dispatchQuestion(const wire::Frame& frame, Observer& observer,
                                            const std::shared_ptr<OutQueue>& out, CallMemory& memory);

// The error text for a call of this unknown name.
std::string unknownOperation(std::string_view name);

// The dictionary in the body of a frame that is no call, or what is wrong with it.
Result<Dictionary, std::string> decodeFrameBody(const wire::Frame& frame);

}  // namespace veltrad::ipc
