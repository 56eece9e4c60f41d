// SPDX-License-Identifier: Apache-2.0
// The commands for writing storebags: lint, fmt and schema.
#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>

#include "formats/json.h"
#include "platform/file_store.h"
#include "storebag/commands.h"
#include "storebag/json_layout.h"
#include "storebag/lint.h"
#include "storebag/schema.h"

namespace veltrad::storebag {
namespace {

constexpr unsigned kUsualMode = 0644;

unsigned modeOf(const std::string& path) {
  struct stat found {};
  return ::stat(path.c_str(), &found) == 0 ? found.st_mode & 07777u : kUsualMode;
}

}  // namespace

Outcome lint(const LintRequest& request) {
  std::string text;
  Array all;
  bool wrong = false;
  std::vector<std::string> failures;
  for (const std::string& file : request.files) {
    const auto bag = readStorebag(file);
    if (!bag && !bag.error().place) {
      failures.push_back(bag.error().line());
      continue;
    }
    const auto findings =
        bag ? lintStorebag(bag.value(), {request.lab}) : std::vector{findingOf(bag.error())};
    for (const Finding& finding : findings) {
      const FindingKind& kind = kindOf(finding.name);
      if (std::find(request.allowed.begin(), request.allowed.end(), kind.name) != request.allowed.end())
        continue;
      wrong = wrong || kind.severity != Severity::note;
      text += lineOf(file, finding) + "\n";
      all.push_back(asDictionary(file, finding));
    }
  }
  if (request.json) text = formats::writeJSON(all) + "\n";
  if (text.empty() && failures.empty()) text = "nothing found\n";
  return {true, std::move(text), wrong, std::move(failures)};
}

Outcome format(const FormatRequest& request) {
  const auto document = readDocument(request.file);
  if (!document) return {false, document.error().line()};
  if (document.value().form != Document::Form::json)
    return {false, request.file +
                       ": a property list has no comments and no order to keep; \"veltra-storebag "
                       "show\" prints it as JSON"};
  const std::string& before = document.value().bytes;
  std::string after = laidOut(before);
  const auto read = formats::parseJSONWithComments(after);
  if (!read || !(read.value() == document.value().content))
    return {false, request.file + ": would not say the same any more; nothing was changed"};
  if (request.check)
    return after == before ? Outcome{true, ""} : Outcome{true, request.file + ": would change\n", true};
  if (!request.write) return {true, std::move(after)};
  if (request.file == "-") return {false, "--write needs a file: standard input cannot be written"};
  if (after == before) return {true, ""};
  platform::DiskFileStore files;
  const auto written = files.replace(request.file, after, modeOf(request.file));
  return written ? Outcome{true, ""} : Outcome{false, written.error().description};
}

Outcome schema() {
  std::string json = formats::writeJSON(schemaOfStorebags(), formats::JSONStyle::pretty);
  if (!json.ends_with('\n')) json += '\n';
  return {true, std::move(json)};
}

}  // namespace veltrad::storebag
