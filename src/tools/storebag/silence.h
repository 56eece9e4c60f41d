// SPDX-License-Identifier: Apache-2.0
// Suppresses the log of the daemon's code while a tool uses it.
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
