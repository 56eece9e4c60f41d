// SPDX-License-Identifier: Apache-2.0
// The client entry of a storebag's section that applies to a back end.
#pragma once

#include <cstddef>
#include <optional>

namespace veltrad::backends {

// The index of the matching entry; if there is none, the nearest entry, and the conditions that do not match.
struct ClientMatch {
  std::optional<std::size_t> entry = std::nullopt;
  std::optional<std::size_t> nearest = std::nullopt;
  bool clientDiffers = false;
  bool serviceDiffers = false;
};

}  // namespace veltrad::backends
