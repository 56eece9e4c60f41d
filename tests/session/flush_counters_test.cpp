// SPDX-License-Identifier: Apache-2.0
// Flushes that wait for several back ends: which answer counts, and that no completion is called under the
// lock.
#include "session/flush_counters.h"

#include <gtest/gtest.h>

#include <vector>

namespace veltrad {
namespace {

using Text = std::optional<std::string>;

// An answer is a text, an error "!" and its description, or nothing.
struct Case {
  std::size_t backends;
  std::vector<Text> answers;
  std::size_t calledBy;  // which answer, from 1; 0: none
};

TEST(FlushCounters, TheFirstErrorOrTheLastAnswerIsGivenOnce) {
  for (const Case& c : std::vector<Case>{{1, {"a"}, 1},
                                         {1, {std::nullopt}, 1},
                                         {3, {"a", "b"}, 0},
                                         {3, {"a", std::nullopt, "c"}, 3},
                                         {3, {"a", "!b", "c"}, 2},
                                         {2, {"!a", "!b"}, 1},
                                         {2, {"a", "!b"}, 2},
                                         {1, {"a", "late", "!later"}, 1}}) {
    session::FlushCounters counters;
    std::vector<Text> given;
    const auto flush = counters.begin(c.backends, [&](const Text& answer, const auto& error) {
      given.push_back(error ? "!" + error->description : answer);
      // Takes the same lock: a call under it would abort here.
      counters.finished(*counters.begin(1, nullptr), std::nullopt, std::nullopt);
    });
    for (std::size_t i = 0; i < c.answers.size(); ++i) {
      const bool error = c.answers[i] && c.answers[i]->starts_with('!');
      counters.finished(
          *flush, error ? std::nullopt : c.answers[i],
          error ? std::optional(wire::makeReportingError(c.answers[i]->substr(1), -1)) : std::nullopt);
      EXPECT_EQ(given.size(), c.calledBy > 0 && i + 1 >= c.calledBy ? 1u : 0u);
    }
    if (c.calledBy > 0) {
      EXPECT_EQ(given.at(0), c.answers[c.calledBy - 1]);
    }
  }
  session::FlushCounters counters;  // nobody waits
  counters.finished(*counters.begin(1, nullptr), "a", std::nullopt);
}

}  // namespace
}  // namespace veltrad
