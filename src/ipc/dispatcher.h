// From a call's frame to the session's operation. The connection's own thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/result.h"
#include "ipc/frame.h"
#include "ipc/out_queue.h"
#include "protocol/client_session_interface.h"

namespace veltrad::ipc {

// Runs the call that the frame holds on `session`; its replies go to `out`. When the frame holds no readable
// call, nothing runs and the answer says in one sentence what is wrong with it: "unknown operation "x"",
// "argument "category" must be a number". Format: docs/wire-protocol.md. `extensionToken` is that of the file
// that came with the frame; empty: none.
std::optional<std::string> dispatchCall(const Frame& frame, ClientSessionInterface& session,
                                        const std::shared_ptr<OutQueue>& out,
                                        const std::string& extensionToken = {});

// The value in a frame's body, which is a dictionary, or what is wrong with it.
Result<Value, std::string> decodeFrameBody(const Frame& frame);

}  // namespace veltrad::ipc
