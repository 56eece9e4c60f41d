// SPDX-License-Identifier: Apache-2.0
// The table of reasons, and docs/reasons.md, which VELTRA_WRITE=1 test_wire --gtest_filter='Reasons.*'
// writes.
#include "wire/reasons.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <set>

namespace veltrad::wire {
namespace {

constexpr std::string_view kPage =
    R"(# Reasons

What became of a message, and of what carries it, is counted by reason. `veltractl stats` shows the texts and how often each
came since the daemon's start; programs know a reason by its name. A name or a text never changes.
This page is made from `src/wire/reasons.def`: `VELTRA_WRITE=1 build/dev/bin/test_wire --gtest_filter='Reasons.*'`

| concerns | name | text |
|---|---|---|
)";

TEST(Reasons, AreWellFormedAndTheirPageIsCurrent) {
  std::string page(kPage);
  std::set<std::string_view> known;
  for (const auto& [concern, name, text] : kReasons) {
    EXPECT_TRUE(known.insert(name).second && known.insert(text).second) << name;
    EXPECT_EQ(name.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789_"), name.npos) << name;
    EXPECT_TRUE(name[0] >= 'a' && name[0] <= 'z') << name;
    page += fmt::format("| {} | `{}` | {} |\n", concern, name, text);
  }
  const std::string path = VELTRA_SOURCE_DIR "/docs/reasons.md";
  if (std::getenv("VELTRA_WRITE")) std::ofstream(path) << page;
  std::ifstream file(path);
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), page) << "see the first line of this test";
}

}  // namespace
}  // namespace veltrad::wire
