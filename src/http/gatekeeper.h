// SPDX-License-Identifier: Apache-2.0
// Finds the requests that the owner of the device does not let leave. HTTP thread.
#pragma once

#include <optional>

#include "http/curl_transfer.h"
#include "http/http_queue.h"
#include "http/request_gate.h"

namespace veltrad::http {

class Gatekeeper {
 public:
  // `gate` outlives it; null: everything may leave.
  explicit Gatekeeper(RequestGate* gate) : _gate(gate) {}

  // Why the request may not begin or go on; nothing: it may.
  std::optional<HTTPError> refusalOf(const CurlTransfer& transfer) const;
  // The error of one that waited and was refused a moment ago, also if the gate has opened since.
  HTTPError refusedBefore(const CurlTransfer& transfer) const;
  // Counts the request for the day and records it, once, also if it begins anew on another connection.
  std::optional<HTTPError> overLimit(CurlTransfer& transfer) const;
  // Those that wait and may not begin.
  HTTPQueue::Transfers takeRefused(HTTPQueue& queue) const;
  // Whether requests have to wait for room for their records.
  bool hasNoRoom() const { return _gate != nullptr && !_gate->hasRoomForRecord(); }
  // Tells the gate how a request that had begun has ended, or that one was refused.
  void ended(const CurlTransfer& transfer, const HTTPResult& result) const;

 private:
  RequestGate* const _gate;
};

}  // namespace veltrad::http
