// SPDX-License-Identifier: Apache-2.0
// The events that the daemon sends to a client, from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "ipc/out_queue.h"

namespace veltrad::ipc {

// The frame of a copy for a client's aggregation callback. `timestamp` is in seconds since 1970. If
// everything is empty or zero, it marks the end of the aggregation.
std::string messageToClient(std::optional<Dictionary> sessionInfo, double timestamp, std::uint16_t category,
                            std::uint16_t type, std::optional<Dictionary> payload);

// Never blocks. Returns why the event was dropped, if it was.
std::optional<std::string> sendEvent(OutQueue& out, std::string_view frame);

// Asks the client to remove the file that it uploads with this call. False if the client has gone.
bool sendRemoveUploadedFile(OutQueue& out, std::uint32_t callID);

// Says that the connection ends because the daemon stops. `calls` is the number of the client's calls that
// were run. What waits for the client still follows.
void sendGoodbye(OutQueue& out, std::uint64_t calls);

}  // namespace veltrad::ipc
