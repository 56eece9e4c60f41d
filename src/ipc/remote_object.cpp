// Events to one client. Any thread.
#include "ipc/remote_object.h"

#include <fmt/format.h>

#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace event = wire::event;
namespace key = wire::key;

void RemoteObject::sendMessageToClient(std::optional<Dictionary> sessionInfo, double timestamp,
                                       std::uint16_t category, std::uint16_t type,
                                       std::optional<Dictionary> payload) {
  Dictionary arguments{
      {key::kTimestamp, timestamp}, {key::kCategory, unsigned{category}}, {key::kType, unsigned{type}}};
  if (sessionInfo) arguments.set(key::kSessionInfo, std::move(*sessionInfo));
  if (payload) arguments.set(key::kPayload, std::move(*payload));
  Dictionary body{{key::kOperation, event::kSendMessageToClient}};
  body.set(key::kArguments, std::move(arguments));
  const std::string frame = wire::makeFrame(wire::FrameKind::event, 0, std::move(body));
  const OutQueue::Sent sent = _out->sendEvent(frame);
  if (sent == OutQueue::Sent::done || !_handler) return;
  switch (sent) {
    case OutQueue::Sent::full:
      _handler(
          fmt::format("The client does not read: more than {} bytes would wait for it.", kOutQueueBound));
      return;
    case OutQueue::Sent::tooLarge:
      _handler(fmt::format("The event of {} bytes is larger than a frame may be ({} bytes).",
                           frame.size() - wire::kFrameHeaderBytes, wire::kFrameBodyLimit));
      return;
    case OutQueue::Sent::gone:
      _handler("The client has gone.");
      return;
    case OutQueue::Sent::done:
      return;
  }
}

bool sendRemoveUploadedFile(OutQueue& out, std::uint32_t callID) {
  Dictionary body{{key::kOperation, event::kRemoveUploadedFile}};
  body.set(key::kArguments, Dictionary{{key::kCall, callID}});
  // Within the bound of replies: it is worth as much as the one that follows it.
  return out.sendReply(wire::makeFrame(wire::FrameKind::event, 0, std::move(body))) == OutQueue::Sent::done;
}

}  // namespace veltrad::ipc
