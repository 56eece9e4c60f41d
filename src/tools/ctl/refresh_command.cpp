// SPDX-License-Identifier: Apache-2.0
// One question a storebag, so that a slow server delays its own line alone.
#include "tools/ctl/refresh_command.h"

#include <fmt/format.h>

#include <string>
#include <vector>

#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/control_client.h"
#include "tools/ctl/print.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

// The daemon gives a server 15 s, and may wait for another's fetch of the same name first.
constexpr std::chrono::seconds kRefreshPatience{60};

// Those with a record, else all.
Result<std::vector<std::string>, std::string> namesToRefresh(ControlClient& daemon) {
  const auto status = daemon.ask(wire::question::kStatus);
  if (!status) return Failure{status.error()};
  std::vector<std::string> all, asked;
  const Array* storebags = status.value().array("storebags");
  for (const Value& one : storebags ? *storebags : Array()) {
    const Dictionary* storebag = one.asDictionary();
    const std::string* name = storebag ? storebag->string("name") : nullptr;
    const std::string* state = storebag ? storebag->string("state") : nullptr;
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

int runRefresh(const Options& options) {
  auto daemon = ControlClient::connect(options.root);
  auto names = !daemon ? Result<std::vector<std::string>, std::string>(Failure{daemon.error()})
               : options.care.key.empty() ? namesToRefresh(daemon.value())
                                          : std::vector{options.care.key};
  if (!names) {
    complain(names.error());
    return 1;
  }
  Array storebags;
  bool all = true;
  for (const std::string& name : names.value()) {
    auto answer = daemon.value().ask(wire::question::kRefresh, {{"name", name}}, kRefreshPatience);
    if (!answer) {
      complain(answer.error());
      return 1;
    }
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
