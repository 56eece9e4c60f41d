// SPDX-License-Identifier: Apache-2.0
// Records what a session has written and counts what it has lost. Used under its connection's lock.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "client/session_description.h"
#include "client/uploaded_file.h"
#include "client/written_calls.h"

namespace veltrad::client {

// A call on its way out.
struct OutCall {
  // A whole frame.
  std::string bytes;
  // Null if there is no descriptor to send, or it was sent.
  std::shared_ptr<UploadedFile> file = nullptr;
  // Null if the call changes nothing.
  std::unique_ptr<SessionChange> change = nullptr;
  // A message, a file or log data, which is counted when it is lost.
  bool counted = false;
};

class SentRecord {
 public:
  // The whole call was written.
  void written(const OutCall& call);
  // Only a part of it was written before the connection ended.
  void cut(const OutCall& call);
  // It was accepted but will not be written.
  void dropped(const OutCall& call) { _lost += call.counted; }
  // Counts the calls as lost that are not known to have been run.
  void connectionEnded();

  WrittenCalls& calls() { return _calls; }
  const WrittenCalls& calls() const { return _calls; }
  SessionDescription& standing() { return _standing; }
  const SessionDescription& standing() const { return _standing; }
  // Calls that were written, on all connections.
  std::uint64_t sent() const { return _sent; }
  std::uint64_t lost() const { return _lost; }
  // Returns the number of lost calls since the last call of this function.
  std::uint64_t tellLost();
  std::uint64_t untold() const { return _lost - _told; }

 private:
  SessionDescription _standing;
  WrittenCalls _calls;
  std::uint64_t _sent = 0;
  std::uint64_t _lost = 0;
  std::uint64_t _told = 0;
};

}  // namespace veltrad::client
