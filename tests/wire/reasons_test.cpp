// The table of reasons, and its page: VELTRA_WRITE=1 test_wire --gtest_filter='Reasons.*' writes
// docs/reasons.md anew.
#include "wire/reasons.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <map>
#include <regex>
#include <set>

namespace veltrad::wire {
namespace {

constexpr const char* kConcerns[] = {
    "Messages", "Events",   "Fields of events", "Energy events", "Datagrams", "Acknowledgements",
    "Files",    "Log data", "Log lines",        "Connections",   "Calls",     "Replies",
    "Sessions", "Back ends"};

TEST(Reasons, AreWellFormedAndTheirPageIsCurrent) {
  std::set<std::string_view> names, texts;
  std::map<Concern, std::string> rows;
  for (const ReasonEntry& entry : kReasons) {
    EXPECT_TRUE(names.insert(entry.name).second && texts.insert(entry.text).second) << entry.name;
    EXPECT_TRUE(std::regex_match(std::string(entry.name), std::regex("[a-z][a-z0-9_]*"))) << entry.name;
    rows[entry.concern] += fmt::format("| `{}` | {} |\n", entry.name, entry.text);
  }
  EXPECT_EQ(entryOf(Reason::no_consent).name, "no_consent");
  std::string page =
      "# Reasons\n\nWhat became of a message, and of what carries it, is counted by reason. `veltractl "
      "stats` shows the\n"
      "texts and how often each came since the daemon's start; programs know a reason by its name. Both are "
      "stable.\n"
      "This page is made from `src/wire/reasons.def` by\n"
      "`VELTRA_WRITE=1 build/dev/bin/test_wire --gtest_filter='Reasons.*'`.\n";
  for (const auto& [concern, lines] : rows) {
    page +=
        fmt::format("\n## {}\n\n| name | text |\n|---|---|\n{}", kConcerns[static_cast<int>(concern)], lines);
  }
  const std::string path = VELTRA_SOURCE_DIR "/docs/reasons.md";
  if (std::getenv("VELTRA_WRITE")) std::ofstream(path) << page;
  std::ifstream file(path);
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), page)
      << "not current; see the top of this test";
}

}  // namespace
}  // namespace veltrad::wire
