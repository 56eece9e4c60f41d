// SPDX-License-Identifier: Apache-2.0
// Decides whether a request may leave the device. Any thread; asked before each request begins.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "wire/reasons.h"

namespace veltrad::http {

struct RequestRefusal {
  wire::Reason reason;
  // One line, for the error of who asked.
  std::string text;
};

class RequestGate {
 public:
  virtual ~RequestGate() = default;
  // `host`: as the URL has it, without port. Nothing: it may begin.
  virtual std::optional<RequestRefusal> refusal(bool forStorebag, std::string_view host) const = 0;
  // Asked once for each request that may begin, but for a storebag's: counts it for the owner's limits of a
  // day, or refuses it. `bytes`: of its body.
  virtual std::optional<RequestRefusal> count(std::uint64_t events, std::uint64_t bytes) = 0;
};

}  // namespace veltrad::http
