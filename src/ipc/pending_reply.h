// One call's answer, still owed. Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>

#include "base/value.h"
#include "ipc/out_queue.h"
#include "wire/client_session_interface.h"

namespace veltrad::ipc {

// Job: sends the reply to one call, at most once; when it goes without an answer, the client's call ends with
// the error "The daemon gave no reply.". Holds the out-queue alone, so it may outlive the connection.
class PendingReply {
 public:
  PendingReply(std::shared_ptr<OutQueue> out, std::uint32_t callID) : _out(std::move(out)), _callID(callID) {}
  ~PendingReply();
  PendingReply(const PendingReply&) = delete;
  PendingReply& operator=(const PendingReply&) = delete;

  // Only the first of all calls to either counts.
  void answer(Dictionary results);
  void fail(const wire::ReportingError& error);

 private:
  void send(Dictionary body) noexcept;
  void sendFrame(Dictionary body);

  const std::shared_ptr<OutQueue> _out;
  const std::uint32_t _callID;
  std::atomic<bool> _answered{false};
};

// The callbacks that a session gets. Each is empty when `pending` is null: the client wants no reply.
wire::StringReply stringReply(std::shared_ptr<PendingReply> pending);
wire::NamesReply namesReply(std::shared_ptr<PendingReply> pending);
wire::FlushReply flushReply(std::shared_ptr<PendingReply> pending);
wire::BooleanReply uploadedReply(std::shared_ptr<PendingReply> pending);
wire::UploadLogDataReply uploadLogDataReply(std::shared_ptr<PendingReply> pending);

}  // namespace veltrad::ipc
