// SPDX-License-Identifier: Apache-2.0
// Makes and sends the frames of events.
#include "ipc/client_events.h"

#include <fmt/format.h>

#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace key = wire::key;

std::string messageToClient(std::optional<Dictionary> sessionInfo, double timestamp, std::uint16_t category,
                            std::uint16_t type, std::optional<Dictionary> payload) {
  Dictionary arguments{
      {key::kTimestamp, timestamp}, {key::kCategory, unsigned{category}}, {key::kType, unsigned{type}}};
  if (sessionInfo) arguments.set(key::kSessionInfo, std::move(*sessionInfo));
  if (payload) arguments.set(key::kPayload, std::move(*payload));
  Dictionary body{{key::kOperation, wire::event::kSendMessageToClient}};
  body.set(key::kArguments, std::move(arguments));
  return wire::makeFrame(wire::FrameKind::event, 0, std::move(body));
}

std::optional<std::string> sendEvent(OutQueue& out, std::string_view frame) {
  switch (out.sendEvent(frame)) {
    case OutQueue::Sent::full:
      return fmt::format("The client does not read: more than {} bytes would wait for it.", kOutQueueBound);
    case OutQueue::Sent::tooLarge:
      return fmt::format("The event of {} bytes is larger than a frame may be ({} bytes).",
                         frame.size() - wire::kFrameHeaderBytes, wire::kFrameBodyLimit);
    case OutQueue::Sent::gone:
      return "The client has gone.";
    case OutQueue::Sent::done:
      break;
  }
  return std::nullopt;
}

bool sendRemoveUploadedFile(OutQueue& out, std::uint32_t callID) {
  Dictionary body{{key::kOperation, wire::event::kRemoveUploadedFile}};
  body.set(key::kArguments, Dictionary{{key::kCall, callID}});
  // Uses the reserve of replies, because it is as important as the reply that follows.
  return out.sendReply(wire::makeFrame(wire::FrameKind::event, 0, std::move(body))) == OutQueue::Sent::done;
}

void sendGoodbye(OutQueue& out, std::uint64_t calls) {
  Dictionary body{{key::kOperation, wire::event::kGoodbye}};
  body.set(key::kArguments, Dictionary{{key::kCalls, calls}});
  out.sendLast(wire::makeFrame(wire::FrameKind::event, 0, std::move(body)));
}

}  // namespace veltrad::ipc
