// SPDX-License-Identifier: Apache-2.0
// Writes the results of suites: as readable text, as JSON and for build servers.
#include <fmt/format.h>

#include <algorithm>

#include "formats/json.h"
#include "storebag/suite.h"
#include "tools/markup.h"

namespace veltrad::storebag {
namespace {

// XML has no control characters.
std::string escapedForXML(std::string text) {
  std::replace_if(
      text.begin(), text.end(), [](unsigned char c) { return c < ' '; }, ' ');
  return tools::escapedForMarkup(text);
}

std::size_t failedCasesOf(const SuiteResult& suite) {
  std::size_t failed = 0;
  for (const CaseResult& one : suite.cases) failed += one.failures.empty() ? 0 : 1;
  return failed;
}

std::size_t casesIn(const std::vector<SuiteResult>& suites) {
  std::size_t all = 0;
  for (const SuiteResult& suite : suites) all += suite.cases.size();
  return all;
}

std::string lineOf(const CaseFailure& failure) {
  return fmt::format("{}: {}: expected {}, got {}", failure.backend, failure.what, failure.expected,
                     failure.got);
}

// A text of JSON as the value that it is.
Value valueOf(const std::string& json) {
  const auto value = formats::parseJSON(json);
  return value ? value.value() : Value(json);
}

}  // namespace

std::size_t failedIn(const std::vector<SuiteResult>& suites) {
  std::size_t failed = 0;
  for (const SuiteResult& suite : suites) failed += failedCasesOf(suite);
  return failed;
}

std::string textOf(const std::vector<SuiteResult>& suites) {
  std::string text;
  for (const SuiteResult& suite : suites) {
    for (const CaseResult& one : suite.cases) {
      text += fmt::format("{} {}: {}\n", one.failures.empty() ? "passed" : "FAILED", suite.file, one.name);
      for (const CaseFailure& failure : one.failures) text += fmt::format("  {}\n", lineOf(failure));
    }
  }
  const std::size_t failed = failedIn(suites);
  return text + fmt::format("{} passed, {} failed\n", casesIn(suites) - failed, failed);
}

Dictionary asDictionary(const std::vector<SuiteResult>& suites) {
  Array all;
  for (const SuiteResult& suite : suites) {
    Array cases;
    for (const CaseResult& one : suite.cases) {
      Array failures;
      for (const CaseFailure& failure : one.failures)
        failures.emplace_back(Dictionary{{"backend", failure.backend},
                                         {"what", failure.what},
                                         {"expected", valueOf(failure.expected)},
                                         {"got", valueOf(failure.got)}});
      cases.emplace_back(Dictionary{
          {"name", one.name}, {"passed", one.failures.empty()}, {"failures", std::move(failures)}});
    }
    all.emplace_back(Dictionary{{"file", suite.file}, {"cases", std::move(cases)}});
  }
  const std::size_t failed = failedIn(suites);
  return {{"suites", std::move(all)},
          {"passed", static_cast<std::uint64_t>(casesIn(suites) - failed)},
          {"failed", static_cast<std::uint64_t>(failed)}};
}

std::string junitOf(const std::vector<SuiteResult>& suites) {
  std::string xml =
      fmt::format("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<testsuites tests=\"{}\" failures=\"{}\">\n",
                  casesIn(suites), failedIn(suites));
  for (const SuiteResult& suite : suites) {
    const std::string file = escapedForXML(suite.file);
    xml += fmt::format("  <testsuite name=\"{}\" tests=\"{}\" failures=\"{}\">\n", file, suite.cases.size(),
                       failedCasesOf(suite));
    for (const CaseResult& one : suite.cases) {
      xml += fmt::format("    <testcase classname=\"{}\" name=\"{}\"", file, escapedForXML(one.name));
      if (one.failures.empty()) {
        xml += "/>\n";
        continue;
      }
      std::string lines;
      for (const CaseFailure& failure : one.failures) lines += escapedForXML(lineOf(failure)) + "\n";
      xml += fmt::format(">\n      <failure message=\"{}\">{}</failure>\n    </testcase>\n",
                         escapedForXML(lineOf(one.failures.front())), lines);
    }
    xml += "  </testsuite>\n";
  }
  return xml + "</testsuites>\n";
}

}  // namespace veltrad::storebag
