// SPDX-License-Identifier: Apache-2.0
// Reads the history from the daemon. One thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/control_client.h"

namespace veltrad::ctl {

// A departure with its result. `facts` is the JSON line for programs.
struct HistoryItem {
  Dictionary facts;
  Array headers;         // lines
  Value day = false;     // a text; where its first record stands
  Value offset = false;  // an integer
  // The digest of a body that was too large to be kept.
  std::optional<std::string> digest;

  // A text of `facts`; empty: there is none.
  std::string text(const char* key) const;
  double time() const { return facts.real("time").value_or(0); }
};

// Oldest first. The error is one line.
Result<std::vector<HistoryItem>, std::string> askForHistory(ControlClient& daemon);
// The body as it left.
Result<std::string, std::string> askForBody(ControlClient& daemon, const HistoryItem& item);

}  // namespace veltrad::ctl
