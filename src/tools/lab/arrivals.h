// SPDX-License-Identifier: Apache-2.0
// The arrivals at the lab, by kind. Any thread.
#pragma once

#include <array>
#include <string_view>

#include "directory.h"
#include "received.h"

namespace veltrad::lab {

// Each kind has a file under received/.
struct Arrivals {
  explicit Arrivals(const Directory& directory)
      : events(directory.receivedPath("events")),
        storebags(directory.receivedPath("storebags")),
        dashboard(directory.receivedPath("dashboard")),
        logData(directory.receivedPath("logdata")),
        uploads(directory.receivedPath("uploads")) {}

  struct Kind {
    std::string_view name;
    const char* title;
    Received& lines;
  };
  std::array<Kind, 5> kinds() {
    return {{{"events", "Events", events},
             {"dashboard", "Dashboard datagrams", dashboard},
             {"logdata", "Log data", logData},
             {"uploads", "Uploads", uploads},
             {"storebags", "Storebag requests", storebags}}};
  }

  Received events;
  Received storebags;
  Received dashboard;
  Received logData;
  Received uploads;
};

}  // namespace veltrad::lab
