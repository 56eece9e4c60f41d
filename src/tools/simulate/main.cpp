// SPDX-License-Identifier: Apache-2.0
// veltra-simulate: reads a scenario (scenario.h) as JSON from standard input, and writes what comes of it as
// JSON to standard output. For fleet/simulate.
#include <cstdio>
#include <string>

#include "fleet.h"
#include "formats/json.h"

namespace {

int fail(const std::string& why) {
  std::fprintf(stderr, "veltra-simulate: %s\n", why.c_str());
  return 1;
}

std::string standardInput() {
  std::string text;
  char piece[4096];
  for (std::size_t got; (got = std::fread(piece, 1, sizeof piece, stdin)) > 0;) text.append(piece, got);
  return text;
}

}  // namespace

int main() {
  using namespace veltrad;
  const auto given = formats::parseJSONWithComments(standardInput());
  if (!given) return fail("no JSON: " + given.error().detail);
  const Dictionary* dictionary = given.value().asDictionary();
  if (!dictionary) return fail("expected a dictionary");
  const auto scenario = simulate::scenarioFrom(*dictionary);
  if (!scenario) return fail(scenario.error());
  simulate::Fleet fleet(scenario.value());
  fleet.run();
  std::printf("%s\n", formats::writeJSON(fleet.report()).c_str());
  return std::fflush(stdout) == 0 ? 0 : fail("standard output cannot be written");
}
