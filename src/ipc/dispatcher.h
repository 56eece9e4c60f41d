// From a call's frame to the session's operation. The connection's own thread.
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

// A client's call waits for its user's memory no longer than this; then it ends with an error.
inline constexpr std::chrono::seconds kLongestWaitForMemory{60};

// Who pays for a call's values, before they are made.
struct CallMemory {
  const std::shared_ptr<platform::MemoryAccount>& account;  // null: nobody
  platform::Charge charge;                                  // held until the call has run
  platform::Counters& counters;
  std::function<bool()> giveUp;  // true: the call must wait no longer
  bool usedUp = false;           // the call was not run for want of it, and has been counted
};

// Runs the call that the frame holds on `session`; its replies go to `out`. When the frame holds no readable
// call, nothing runs and the answer says in one sentence what is wrong with it: "unknown operation "x"",
// "argument "category" must be a number". Format: docs/wire-protocol.md. `extensionToken` is that of the file
// that came with the frame; empty: none.
std::optional<std::string> dispatchCall(const wire::Frame& frame, wire::ClientSessionInterface& session,
                                        const std::shared_ptr<OutQueue>& out, CallMemory& memory,
                                        const std::string& extensionToken = {});

// The same for a call on the control socket, which `observer` answers.
std::optional<std::string> dispatchQuestion(const wire::Frame& frame, Observer& observer,
                                            const std::shared_ptr<OutQueue>& out, CallMemory& memory);

// What is wrong with a call of this name.
std::string unknownOperation(std::string_view name);

// The dictionary in the body of a frame that is no call, or what is wrong with it.
Result<Dictionary, std::string> decodeFrameBody(const wire::Frame& frame);

}  // namespace veltrad::ipc
