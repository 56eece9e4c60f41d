// SPDX-License-Identifier: Apache-2.0
// `veltractl history`: lists, shows and removes what left.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>

#include "base/text.h"
#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/history_client.h"
#include "tools/ctl/history_page.h"
#include "tools/ctl/history_text.h"
#include "tools/ctl/print.h"
#include "tools/ctl/readable_body.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

int listHistory(ControlClient& daemon, const Options& options) {
  const auto items = askForHistory(daemon);
  if (!items) return refused(items.error());
  if (options.care.html) {
    const auto bodyOf = [&daemon](const HistoryItem& item) { return askForBody(daemon, item); };
    const auto written = writeHistoryPage(*options.care.html, items.value(), bodyOf);
    return written ? 0 : refused(written.error());
  }
  for (const HistoryItem& item : items.value()) {
    if (!printLine(options.json ? formats::writeJSON(item.facts) : lineOfItem(item))) return 1;
  }
  if (items.value().empty() && !options.json)
    return printed("Nothing is kept. \"history\" in etc/veltrad/policy.json says what is.");
  return 0;
}

int show(ControlClient& daemon, const Options& options) {
  const auto items = askForHistory(daemon);
  if (!items) return refused(items.error());
  const auto found = std::find_if(items.value().begin(), items.value().end(), [&](const HistoryItem& item) {
    return item.text("id") == options.care.key;
  });
  if (found == items.value().end())
    return refused(
        fmt::format("There is no record \"{}\": see veltractl history.", escapedForLog(options.care.key)));
  const HistoryItem& item = *found;
  const bool raw = options.care.raw;
  if (raw && item.digest) return refused(withoutBody(item));
  const auto body = item.digest ? Result<std::string, std::string>(std::string()) : askForBody(daemon, item);
  if (!body) return refused(body.error());
  if (raw) {
    const bool written =
        std::fwrite(body.value().data(), 1, body.value().size(), stdout) == body.value().size() &&
        std::fflush(stdout) == 0;
    return written ? 0 : refused("Cannot write to standard output.");
  }
  const std::string readable =
      item.digest ? withoutBody(item) : readableBody(item.text("kind"), body.value());
  if (!options.json) return printed(headOfItem(item) + "\n\n" + readable);
  Dictionary all = item.facts;
  all.set("headers", item.headers);
  all.set("readable", readable);
  return printed(formats::writeJSON(all));
}

int purge(ControlClient& daemon, const Options& options) {
  const auto removed = daemon.ask(wire::question::kPurgeHistory);
  if (!removed) return refused(removed.error());
  const Dictionary& counts = removed.value();
  return printed(options.json ? formats::writeJSON(counts)
                              : fmt::format("{} records of {} days were removed, {} bytes.",
                                            numberIn(counts, "records"), numberIn(counts, "days"),
                                            numberIn(counts, "bytes")));
}

}  // namespace

int runHistory(ControlClient& daemon, const Options& options) {
  if (options.command == Command::historyShow) return show(daemon, options);
  if (options.command == Command::historyPurge) return purge(daemon, options);
  return listHistory(daemon, options);
}

}  // namespace veltrad::ctl
