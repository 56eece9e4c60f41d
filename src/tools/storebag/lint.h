// SPDX-License-Identifier: Apache-2.0
// Finds mistakes in the content of a storebag.
#pragma once

#include <string>
#include <vector>

#include "storebag/document.h"
#include "storebag/findings.h"

namespace veltrad::storebag {

struct LintOptions {
  // The placeholders of veltra-lab, "${url}" and "${dashboardPort}", stand for what the lab puts there.
  bool lab = false;
};

// All findings, in the order of their places.
std::vector<Finding> lintStorebag(const StorebagDocument& bag, const LintOptions& options = {});
// The errors among them, one a line behind a line with their number; empty if there are none.
std::string errorsIn(const StorebagDocument& bag);
// The finding for a file that is no storebag.
Finding findingOf(const DocumentFailure& failure);

}  // namespace veltrad::storebag
