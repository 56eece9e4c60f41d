// SPDX-License-Identifier: Apache-2.0
// The reply to one call, to be sent from any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>

#include "base/value.h"
#include "ipc/out_queue.h"
#include "wire/client_session_interface.h"

namespace veltrad::ipc {

// Sends the reply to one call, once. If it is destroyed without an answer, the call ends with the error "The
// daemon gave no reply.". It may outlive the connection.
class PendingReply {
 public:
  PendingReply(std::shared_ptr<OutQueue> out, std::uint32_t callID) : _out(std::move(out)), _callID(callID) {}
  ~PendingReply();

  // Only the first call of any of these functions counts.
  void answer(Dictionary results);
  // To a message, without a text.
  void answerSent(const wire::Outcomes& outcomes);
  void fail(const wire::ReportingError& error);

 private:
  void send(Dictionary body) noexcept;
  void sendFrame(Dictionary body);

  const std::shared_ptr<OutQueue> _out;
  const std::uint32_t _callID;
  std::atomic<bool> _answered{false};
};

// The callbacks for a session. Each is empty if `pending` is null, which means that the client wants no
// reply.
wire::StringReply stringReply(std::shared_ptr<PendingReply> pending);
wire::SentReply sentReply(std::shared_ptr<PendingReply> pending);
wire::NamesReply namesReply(std::shared_ptr<PendingReply> pending);
wire::FlushReply flushReply(std::shared_ptr<PendingReply> pending);
wire::BooleanReply uploadedReply(std::shared_ptr<PendingReply> pending);
wire::UploadLogDataReply uploadLogDataReply(std::shared_ptr<PendingReply> pending);

}  // namespace veltrad::ipc
