// SPDX-License-Identifier: Apache-2.0
// `veltractl spool`: lists, hurries and drops what is kept.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <chrono>
#include <cmath>

#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/history_text.h"
#include "tools/ctl/print.h"
#include "tools/ctl/status_report.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

namespace question = wire::question;

std::string lineOfPost(const Dictionary& post, double now) {
  const double next = post.real("nextTry").value_or(0);
  const std::string error = textIn(post, "lastError");
  return fmt::format(
      "{}  {}  {} events, {} bytes to {}{}  {} tries{}; next try {}", textIn(post, "id"),
      timeText(post.real("time").value_or(0)), numberIn(post, "events"), numberIn(post, "bytes"),
      textIn(post, "url"),
      textIn(post, "client").empty() ? "" : ", of " + textIn(post, "client") + "/" + textIn(post, "service"),
      numberIn(post, "tries"), error.empty() ? "" : ", last: " + error,
      std::isfinite(next) && next > now ? "in " + formatDuration(next - now) : "at its turn");
}

int listSpool(ControlClient& daemon, const Options& options) {
  std::size_t count = 0;
  Dictionary arguments;
  for (;;) {
    const auto page = daemon.ask(question::kSpool, arguments);
    if (!page) return refused(page.error());
    const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
    for (const Dictionary* post : dictionariesIn(page.value(), "posts")) {
      ++count;
      if (!printLine(options.json ? formats::writeJSON(*post) : lineOfPost(*post, now.count()))) return 1;
    }
    const Value* next = page.value().find("next");
    if (!next) break;
    arguments.set("after", *next);
  }
  return count == 0 && !options.json ? printed("Nothing is in the spool.") : 0;
}

int change(ControlClient& daemon, const Options& options) {
  const bool sends = options.command == Command::spoolSend;
  Dictionary arguments;
  if (!sends) arguments.set("ids", Array(options.care.ids.begin(), options.care.ids.end()));
  const auto done = daemon.ask(sends ? question::kSendSpool : question::kDropFromSpool, arguments);
  if (!done) return refused(done.error());
  const char* words = sends ? "posts leave now, as fast as the pace allows." : "posts were dropped.";
  return printed(options.json ? formats::writeJSON(done.value())
                              : fmt::format("{} {}", numberIn(done.value(), "posts"), words));
}

}  // namespace

int runSpool(ControlClient& daemon, const Options& options) {
  return options.command == Command::spool ? listSpool(daemon, options) : change(daemon, options);
}

}  // namespace veltrad::ctl
