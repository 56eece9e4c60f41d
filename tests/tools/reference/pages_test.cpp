// SPDX-License-Identifier: Apache-2.0
// docs/reference and the completions match the programs. VELTRA_WRITE=1 test_tools_reference writes them.
#include "tools/reference/pages.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>

namespace veltrad::reference {
namespace {

const std::filesystem::path kSources = VELTRA_SOURCE_DIR;

std::string contentOf(const std::filesystem::path& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), {}};
}

void expectCurrent(const std::filesystem::path& path, const std::string& expected) {
  if (std::getenv("VELTRA_WRITE")) std::ofstream(path) << expected;
  EXPECT_TRUE(contentOf(path) == expected) << path << " is not current: see the first line of this test";
}

TEST(Pages, AreCurrent) {
  std::size_t pages = 0;
  for (const auto& entry : std::filesystem::directory_iterator(kSources / "docs/reference")) {
    const auto page = withMadeParts(contentOf(entry.path()), kSources);
    ASSERT_TRUE(page.ok()) << entry.path() << ": " << page.error();
    expectCurrent(entry.path(), page.value());
    ++pages;
  }
  EXPECT_EQ(pages, 10u);
  for (const MadeFile& file : madeFiles()) expectCurrent(kSources / file.path, file.make());
}

// Parts that are written by hand: paths and variables.
TEST(Pages, NameEveryPathAndVariable) {
  const std::string page = contentOf(kSources / "docs/reference/veltrad.5.md");
  const std::pair<const char*, std::regex> sources[] = {
      {"src/platform/root.h", std::regex(R"(path\(\s*"([^"]+)\")")},
      {"src/wire/socket_path.cpp", std::regex(R"(, "(run/[^"]+)\")")},
      {"src/daemon/main.cpp", std::regex(R"("((VELTRA|LC)_[A-Z_]+)\")")}};
  for (const auto& [source, pattern] : sources) {
    const std::string text = contentOf(kSources / source);
    std::size_t found = 0;
    for (std::sregex_iterator match(text.begin(), text.end(), pattern), end; match != end; ++match, ++found)
      EXPECT_NE(page.find((*match)[1].str()), std::string::npos) << source << ": " << (*match)[1];
    EXPECT_GE(found, 2u) << source;
  }
}

// What bash offers for the last word. compopt works only while bash itself completes.
std::string offered(const std::string& words) {
  const std::string script = "compopt() { :; }; source packaging/completions/veltractl.bash; COMP_WORDS=(" +
                             words +
                             "); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _veltractl; echo \"${COMPREPLY[*]}\"";
  const std::string command = "cd '" + kSources.string() + "' && bash -c '" + script + "'";
  std::FILE* output = popen(command.c_str(), "r");
  char line[4096] = "";
  if (std::fgets(line, sizeof line, output) == nullptr) ADD_FAILURE() << words;
  pclose(output);
  return line;
}

TEST(Completions, OfBash) {
  const std::pair<const char*, const char*> cases[] = {
      {"veltractl sta", "states status stats\n"},
      {"veltractl --root send sta", "states status stats\n"},
      {"veltractl send --cat", "--category\n"},
      {"veltractl status --js", "--json\n"},
      {"veltractl send --type \"\"", "\n"},
      {"veltractl upload READ", "README.md\n"},
      {"veltractl --root exam", "examples\n"},
      {"veltractl config get env", "environmentType\n"},
      {"veltractl config unset --json com.", "com.florn.timed/TMAutomaticTimeZoneEnabled\n"},
      {"veltractl config set environmentType env", "\n"}};
  for (const auto& [words, expected] : cases) EXPECT_EQ(offered(words), expected) << words;
}

TEST(Pages, NameWhatCannotBeMade) {
  EXPECT_EQ(withMadeParts("a\n<!-- made: nothing -->\n<!-- end -->\n", kSources).error(),
            "\"nothing\" is neither a part that can be made nor a file");
  EXPECT_FALSE(withMadeParts("<!-- made: reasons -->\ntext", kSources).ok());
}

}  // namespace
}  // namespace veltrad::reference
