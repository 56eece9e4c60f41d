// SPDX-License-Identifier: Apache-2.0
// The made parts by their names.
#include "tools/reference/pages.h"

#include <fmt/format.h>

#include <fstream>
#include <iterator>
#include <optional>

#include "config/operator_settings.h"
#include "config/policy.h"
#include "config/storebag_content.h"
#include "storebag/options.h"
#include "tools/ctl/options.h"
#include "tools/gateway/options.h"
#include "tools/lab/options.h"
#include "tools/reference/command_pages.h"
#include "tools/reference/completions.h"
#include "tools/reference/header_page.h"
#include "tools/reference/key_pages.h"
#include "tools/reference/markdown.h"

namespace veltrad::reference {
namespace {

constexpr std::string_view kBegin = "<!-- made: ";
constexpr std::string_view kBeginEnd = " -->";
constexpr std::string_view kEnd = "<!-- end -->";

struct Part {
  std::string_view name;
  std::string (*make)();
};

constexpr Part kParts[] = {
    {"options of veltractl", [] { return optionsOf(ctl::commandLine()); }},
    {"commands of veltractl", [] { return commandsOf(ctl::commandLine()); }},
    {"options of veltra-storebag", [] { return optionsOf(storebag::commandLine()); }},
    {"commands of veltra-storebag", [] { return commandsOf(storebag::commandLine()); }},
    {"description of veltra-lab", [] { return prose(lab::commandLine().about); }},
    {"options of veltra-lab", [] { return optionsOf(lab::commandLine()); }},
    {"description of veltra-gateway", [] { return prose(gateway::commandLine().about); }},
    {"options of veltra-gateway", [] { return optionsOf(gateway::commandLine()); }},
    {"commands of veltra-gateway", [] { return commandsOf(gateway::commandLine()); }},
    {"keys of a storebag", [] { return keysOf(config::Storebag::kKeys); }},
    {"findings of lint", findings},
    {"keys of settings", [] { return keysOf(config::OperatorChoices::kKeys); }},
    {"keys of the policy", [] { return keysOf(config::PolicyRules::kKeys); }},
    {"preferences", preferences},
    {"client types", clientTypes},
    {"environments", environments},
    {"reasons", reasons},
};

constexpr MadeFile kFiles[] = {
    {"packaging/completions/veltractl.bash", [] { return bashCompletion(ctl::commandLine()); }},
    {"packaging/completions/_veltractl", [] { return zshCompletion(ctl::commandLine()); }},
    {"packaging/completions/veltractl.fish", [] { return fishCompletion(ctl::commandLine()); }},
};

std::optional<std::string> contentOf(const std::string& path) {
  std::ifstream file(path);
  if (!file) return std::nullopt;
  return std::string(std::istreambuf_iterator<char>(file), {});
}

// A part of the table, else a file of the tree: headers become a page, others a block of code.
std::optional<std::string> made(std::string_view name, const std::string& sources) {
  for (const Part& part : kParts)
    if (part.name == name) return part.make();
  const auto content = contentOf(fmt::format("{}/{}", sources, name));
  if (!content) return std::nullopt;
  return name.ends_with(".h") ? pageOfHeader(*content) : fmt::format("```\n{}```\n", *content);
}

}  // namespace

std::span<const MadeFile> madeFiles() {
  return kFiles;
}

Result<std::string, std::string> withMadeParts(std::string_view page, const std::string& sources) {
  std::string result;
  for (std::size_t begin = page.find(kBegin); begin != std::string_view::npos; begin = page.find(kBegin)) {
    const std::size_t nameEnd = page.find(kBeginEnd, begin);
    const std::size_t end = page.find(kEnd, begin);
    if (nameEnd > end || end == std::string_view::npos)
      return Failure{fmt::format("no \"{}\" after \"{}\"", kEnd, page.substr(begin, 40))};
    const std::string_view name = page.substr(begin + kBegin.size(), nameEnd - begin - kBegin.size());
    const auto text = made(name, sources);
    if (!text) return Failure{fmt::format("\"{}\" is neither a part that can be made nor a file", name)};
    result += fmt::format("{}\n\n{}\n{}", page.substr(0, nameEnd + kBeginEnd.size()), *text, kEnd);
    page.remove_prefix(end + kEnd.size());
  }
  return result + std::string(page);
}

}  // namespace veltrad::reference
