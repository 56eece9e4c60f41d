// SPDX-License-Identifier: Apache-2.0
// Lists, shows and removes what left.
#include "tools/ctl/history_command.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdio>

#include "base/text.h"
#include "formats/json.h"
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
    return printLine("Nothing is kept. \"history\" in etc/veltrad/policy.json says what is.") ? 0 : 1;
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
  if (!options.json) return printLine(headOfItem(item) + "\n\n" + readable) ? 0 : 1;
  Dictionary all = item.facts;
  all.set("headers", item.headers);
  all.set("readable", readable);
  return printLine(formats::writeJSON(all)) ? 0 : 1;
}

int purge(ControlClient& daemon, const Options& options) {
  const auto removed = daemon.ask(wire::question::kPurgeHistory);
  if (!removed) return refused(removed.error());
  const auto number = [&removed](const char* key) {
    const Value* value = removed.value().find(key);
    return value ? value->toInt64().value_or(0) : 0;
  };
  return printLine(options.json ? formats::writeJSON(removed.value())
                                : fmt::format("{} records of {} days were removed, {} bytes.",
                                              number("records"), number("days"), number("bytes")))
             ? 0
             : 1;
}

}  // namespace

int runHistory(const Options& options) {
  auto daemon = ControlClient::connect(options.root);
  if (!daemon) return refused(daemon.error());
  if (options.command == Command::historyShow) return show(daemon.value(), options);
  if (options.command == Command::historyPurge) return purge(daemon.value(), options);
  return listHistory(daemon.value(), options);
}

}  // namespace veltrad::ctl
