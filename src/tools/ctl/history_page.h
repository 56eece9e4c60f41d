// SPDX-License-Identifier: Apache-2.0
// Writes the history as an HTML page. One thread.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "base/result.h"
#include "tools/ctl/history_client.h"

namespace veltrad::ctl {

// Gets the body of an item as it left.
using BodyOf = std::function<Result<std::string, std::string>(const HistoryItem&)>;

// Writes the page to a new file, mode 0600: by day, newest first, destination and client, each item opening
// to what exactly left. It needs no script, and nothing from elsewhere. What could not be written whole is
// taken away; the error is one line.
Result<Done, std::string> writeHistoryPage(const std::string& path, const std::vector<HistoryItem>& items,
                                           const BodyOf& bodyOf);

}  // namespace veltrad::ctl
