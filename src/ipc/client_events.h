// The events that the daemon sends to a client. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "ipc/out_queue.h"

namespace veltrad::ipc {

// The frame of a copy for the client's aggregation callback, the same for every client. `timestamp` in
// seconds since 1970. Everything empty or zero: the end of aggregation.
std::string messageToClient(std::optional<Dictionary> sessionInfo, double timestamp, std::uint16_t category,
                            std::uint16_t type, std::optional<Dictionary> payload);

// Never blocks; no answer is awaited. Why the event was dropped, or nothing.
std::optional<std::string> sendEvent(OutQueue& out, std::string_view frame);

// Asks the client to remove the file that it uploads with that call. No answer is awaited.
bool sendRemoveUploadedFile(OutQueue& out, std::uint32_t callID);

}  // namespace veltrad::ipc
