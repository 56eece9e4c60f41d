// SPDX-License-Identifier: Apache-2.0
// `veltractl status` and `veltractl metrics`: asks, puts the pages together, prints.
#include "tools/ctl/commands.h"

#include <fmt/format.h>
#include <unistd.h>

#include <chrono>

#include "formats/json.h"
#include "tools/ctl/print.h"
#include "tools/ctl/status_report.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

constexpr std::chrono::seconds kRedraw{1};

std::string textOf(const Options& options, const Dictionary& status) {
  if (options.json) return formats::writeJSON(status);
  const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
  return formatStatus(status, now.count());
}

bool printStatus(const Options& options, bool redraw) {
  const auto status = askForStatus(options);
  std::string text = status ? textOf(options, status.value()) : std::string();
  if (!redraw && !status) complain(status.error());
  if (!redraw) return status && printLine(text);
  // The cursor to the top, each line to its end and then the rest of the screen cleared: nothing flickers.
  std::string screen = "\033[H";
  for (const char c : status ? text : "veltractl: " + status.error()) {
    if (c == '\n') screen += "\033[K";
    screen += c;
  }
  return printLine(screen + "\033[K\033[J");
}

}  // namespace

Result<Dictionary, std::string> askForStatus(const Options& options) {
  auto client = ControlClient::connect(options.root);
  if (!client) return Failure{client.error()};
  auto status = client.value().ask(wire::question::kStatus);
  if (!status) return status;
  Array sessions;
  for (Value after = 0;;) {
    auto page = client.value().ask(wire::question::kSessions, {{"after", after}});
    if (!page) return page;
    const bool more = page.value().boolean("more").value_or(false);
    auto taken = page.value().take("sessions");
    auto listed = taken ? std::move(*taken).takeArray() : std::nullopt;
    if (!listed) break;
    for (Value& session : *listed) sessions.push_back(std::move(session));
    const Dictionary* last = sessions.empty() ? nullptr : sessions.back().asDictionary();
    const Value* id = last ? last->find("id") : nullptr;
    if (!more || !id) break;
    after = *id;
  }
  status.value().set("sessions", treeOfSessions(std::move(sessions)));
  return status;
}

int runStatus(const Options& options, Interrupt& interrupt) {
  if (!options.care.watch) return printStatus(options, false) ? 0 : 1;
  interrupt.begin();
  const bool redraw = !options.json && ::isatty(STDOUT_FILENO);
  if (redraw && !printLine("\033[2J")) return 1;
  do {
    if (!printStatus(options, redraw) && !redraw) return 1;
  } while (interrupt.wait(-1, kRedraw) != Interrupt::Wake::interrupted);
  return 0;
}

int runMetrics(ControlClient& daemon, const Options&) {
  const auto answer = daemon.ask(wire::question::kMetrics);
  if (!answer) return refused(answer.error());
  const std::string* text = answer.value().string("text");
  if (!text) return refused("veltrad answered without metrics.");
  return printed(std::string_view(*text).substr(0, text->size() - 1));
}

}  // namespace veltrad::ctl
