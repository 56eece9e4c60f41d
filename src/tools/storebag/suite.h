// SPDX-License-Identifier: Apache-2.0
// Suites of cases that say what a storebag is to do.
#pragma once

#include <string>
#include <vector>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::storebag {

struct CaseFailure {
  std::string backend;
  // The key of "expect".
  std::string what;
  // As JSON.
  std::string expected, got;
};
struct CaseResult {
  std::string name;
  std::vector<CaseFailure> failures;
};
struct SuiteResult {
  std::string file;
  std::vector<CaseResult> cases;
};

// Runs all cases of a suite. The error says what is wrong with the file, and where.
Result<SuiteResult, std::string> runSuite(const std::string& file);

std::size_t failedIn(const std::vector<SuiteResult>& suites);
// Three forms of output.
std::string textOf(const std::vector<SuiteResult>& suites);
Dictionary asDictionary(const std::vector<SuiteResult>& suites);
std::string junitOf(const std::vector<SuiteResult>& suites);

}  // namespace veltrad::storebag
