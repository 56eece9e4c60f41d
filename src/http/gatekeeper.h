// SPDX-License-Identifier: Apache-2.0
// Checks HTTP requests against the owner's decision before and while they run. HTTP thread.
#pragma once

#include <optional>

#include "http/curl_transfer.h"
#include "http/http_queue.h"
#include "http/request_gate.h"

namespace veltrad::http {

class Gatekeeper {
 public:
  // `gate` must outlive it; null: everything may leave.
  explicit Gatekeeper(RequestGate* gate) : _gate(gate) {}

  // Why the request may not begin or continue; absent if it may.
  std::optional<HTTPError> refusalOf(const CurlTransfer& transfer) const;
  // The error of a waiting request that was just refused, even if the gate has opened since.
  HTTPError refusedBefore(const CurlTransfer& transfer) const;
  // Counts the request for the day and records it, once, also if it starts again on another connection.
  std::optional<HTTPError> overLimit(CurlTransfer& transfer) const;
  // Takes the waiting requests that may not begin.
  HTTPQueue::Transfers takeRefused(HTTPQueue& queue) const;
  // Whether requests have to wait for room for their records.
  bool hasNoRoom() const { return _gate != nullptr && !_gate->hasRoomForRecord(); }
  // Reports the end of a request that had begun, or a refusal, to the gate.
  void ended(const CurlTransfer& transfer, const HTTPResult& result) const;

 private:
  RequestGate* const _gate;
};

}  // namespace veltrad::http
