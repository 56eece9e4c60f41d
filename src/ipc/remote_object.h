// The client's object, as the daemon calls it. Any thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "ipc/out_queue.h"
#include "wire/client_session_reply_interface.h"

namespace veltrad::ipc {

// Job: turns calls on the client's object into event frames. Never blocks; holds the out-queue alone, so it
// may outlive the connection. The handler runs on the calling thread, inside the call that failed.
class RemoteObject final : public wire::ClientSessionReplyInterface {
 public:
  using ErrorHandler = std::function<void(const std::string& description)>;
  RemoteObject(std::shared_ptr<OutQueue> out, ErrorHandler handler)
      : _out(std::move(out)), _handler(std::move(handler)) {}

  void sendMessageToClient(std::optional<Dictionary> sessionInfo, double timestamp, std::uint16_t category,
                           std::uint16_t type, std::optional<Dictionary> payload) override;

 private:
  const std::shared_ptr<OutQueue> _out;
  const ErrorHandler _handler;
};

// Asks the client to remove the file that it uploads with that call. No answer is awaited.
bool sendRemoveUploadedFile(OutQueue& out, std::uint32_t callID);

}  // namespace veltrad::ipc
