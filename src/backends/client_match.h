// SPDX-License-Identifier: Apache-2.0
// Which client entry of a storebag's section holds for a back end.
#pragma once

#include <cstddef>
#include <optional>

namespace veltrad::backends {

// The entry that fits, by its place; if none does, the nearest one, and what of it does not fit.
struct ClientMatch {
  std::optional<std::size_t> entry = std::nullopt;
  std::optional<std::size_t> nearest = std::nullopt;
  bool clientDiffers = false;
  bool serviceDiffers = false;
};

}  // namespace veltrad::backends
