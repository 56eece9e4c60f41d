// SPDX-License-Identifier: Apache-2.0
// `veltractl doctor`. The daemon decides all checks but the first, which is whether it can be asked.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <vector>

#include "client/daemon_socket.h"
#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/print.h"
#include "wire/constants.h"
#include "wire/names.h"
#include "wire/socket_path.h"

namespace veltrad::ctl {

namespace {

// Nine storebags, each of which may take 15 s.
constexpr std::chrono::seconds kDoctorPatience{150};

Value checkOf(const char* name, const char* result, std::string text, std::string mend = {}) {
  return Dictionary{{"name", name}, {"result", result}, {"text", std::move(text)}, {"mend", std::move(mend)}};
}

// The checks from this one on.
void skipFrom(std::size_t first, const std::string& why, Array& checks) {
  for (std::size_t i = first; i < std::size(wire::check::kNames); ++i)
    checks.push_back(checkOf(wire::check::kNames[i], "skipped", why));
}

Array withoutDaemon(const std::string& why) {
  Array checks{checkOf("daemon", "failure", why, "start veltrad: systemctl start veltrad")};
  skipFrom(1, "the daemon cannot be asked", checks);
  return checks;
}

// The result of connecting as a client.
Value tryAsClient(const Options& options) {
  const auto daemon = client::reachDaemon(
      wire::socketPathUnder(options.root ? *options.root : wire::rootFromEnvironment()), "");
  if (daemon) return checkOf("entitlement", "ok", "this user may report");
  return checkOf("entitlement", "failure", daemon.error().text,
                 fmt::format("let this user report: a rule with \"{}\" in etc/veltrad/entitlements.plist",
                             wire::kVeltraEntitlement));
}

Array withoutRight(const Options& options) {
  Array checks{checkOf("daemon", "ok", "veltrad answers"), tryAsClient(options)};
  skipFrom(2,
           fmt::format("this user may not ask: run it as root, or with the entitlement \"{}\"",
                       wire::kObserveEntitlement),
           checks);
  return checks;
}

Array askForChecks(const Options& options) {
  auto client = ControlClient::connect(options.root);
  if (!client) return withoutDaemon(client.error());
  Array types;
  for (const std::int32_t type : options.care.clientTypes) types.push_back(type);
  auto answer =
      client.value().ask(wire::question::kDoctor, {{"clientTypes", std::move(types)}}, kDoctorPatience);
  if (!answer) {
    const bool mayNot = answer.error().find(wire::kObserveEntitlement) != std::string::npos;
    return mayNot ? withoutRight(options) : withoutDaemon(answer.error());
  }
  const std::string* version = answer.value().string("version");
  Array checks{checkOf("daemon", "ok",
                       fmt::format("veltrad {}, process {}", version ? *version : "",
                                   answer.value().int32("pid").value_or(0)))};
  auto taken = answer.value().take("checks");
  auto decided = taken ? std::move(*taken).takeArray() : std::nullopt;
  if (!decided) return withoutDaemon("veltrad answered without checks.");
  for (Value& check : *decided) checks.push_back(std::move(check));
  return checks;
}

std::string formatChecks(const std::vector<const Dictionary*>& checks) {
  std::string all;
  for (const Dictionary* check : checks) {
    if (!all.empty()) all += '\n';
    all += fmt::format("{:<8}{:<17}{}", textIn(*check, "result"), textIn(*check, "name"),
                       textIn(*check, "text"));
    if (const std::string mend = textIn(*check, "mend"); !mend.empty())
      all += fmt::format("\n{:8}to do: {}", "", mend);
  }
  return all;
}

}  // namespace

int runDoctor(const Options& options) {
  Dictionary report{{"checks", askForChecks(options)}};
  const auto checks = dictionariesIn(report, "checks");
  const bool failed = std::any_of(checks.begin(), checks.end(), [](const Dictionary* check) {
    return textIn(*check, "result") == "failure";
  });
  if (!options.json) return printed(formatChecks(checks)) == 0 && !failed ? 0 : 1;
  report.set("ok", !failed);
  return printed(formats::writeJSON(report)) == 0 && !failed ? 0 : 1;
}

}  // namespace veltrad::ctl
