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
  // Counts the request for the day, once, also if it begins anew on another connection.
  std::optional<HTTPError> overLimit(CurlTransfer& transfer) const;
  // Those that wait and may not begin.
  HTTPQueue::Transfers takeRefused(HTTPQueue& queue) const;

 private:
  RequestGate* const _gate;
};

}  // namespace veltrad::http
