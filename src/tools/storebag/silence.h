// SPDX-License-Identifier: Apache-2.0
// Keeps the daemon's code quiet while a tool uses it: the lines of its log are not what was asked for.
#pragma once

#include <string_view>

#include "platform/log.h"

namespace veltrad::storebag {

class Silence {
 public:
  Silence() {
    platform::log::setSink([](platform::LogLevel, std::string_view) {});
  }
  Silence(const Silence&) = delete;
  Silence& operator=(const Silence&) = delete;
  ~Silence() { platform::log::setSink(nullptr); }
};

}  // namespace veltrad::storebag
