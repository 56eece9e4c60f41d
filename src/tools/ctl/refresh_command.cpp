// SPDX-License-Identifier: Apache-2.0
// `veltractl refresh`: one question a storebag, so that a slow server delays its own line alone.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <string>
#include <vector>

#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/print.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

// The daemon gives a server 15 s, and may wait for another's fetch of the same name first.
constexpr std::chrono::seconds kRefreshPatience{60};

// The storebags with a record, or all if there is none.
Result<std::vector<std::string>, std::string> namesToRefresh(ControlClient& daemon) {
  const auto status = daemon.ask(wire::question::kStatus);
  if (!status) return Failure{status.error()};
  std::vector<std::string> all, asked;
  for (const Dictionary* storebag : dictionariesIn(status.value(), "storebags")) {
    const std::string* name = storebag->string("name");
    const std::string* state = storebag->string("state");
    if (!name || !state) continue;
    all.push_back(*name);
    if (*state != "never") asked.push_back(*name);
  }
  return asked.empty() ? all : asked;
}

std::string lineOf(const Dictionary& storebag, bool fetched) {
  std::string line = fmt::format("{}: {}", textIn(storebag, "name"), textIn(storebag, "result"));
  const std::string signature = textIn(storebag, "signature"), reason = textIn(storebag, "reason");
  const std::string version = textIn(storebag, "version");
  if (!signature.empty()) line += ", signature " + signature;
  if (!reason.empty()) line += ": " + reason;
  if (!version.empty()) line += fetched ? ", version " + version : "; version " + version + " stays in use";
  return line;
}

}  // namespace

int runRefresh(ControlClient& daemon, const Options& options) {
  const auto names = options.care.key.empty() ? namesToRefresh(daemon) : std::vector{options.care.key};
  if (!names) return refused(names.error());
  Array storebags;
  bool all = true;
  for (const std::string& name : names.value()) {
    auto answer = daemon.ask(wire::question::kRefresh, {{"name", name}}, kRefreshPatience);
    if (!answer) return refused(answer.error());
    const bool fetched = textIn(answer.value(), "result") == "fetched";
    all = all && fetched;
    if (!options.json && !printLine(lineOf(answer.value(), fetched))) return 1;
    storebags.push_back(std::move(answer.value()));
  }
  if (options.json && !printLine(formats::writeJSON(Dictionary{{"storebags", std::move(storebags)}})))
    return 1;
  return all ? 0 : 1;
}

}  // namespace veltrad::ctl
