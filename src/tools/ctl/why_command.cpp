// SPDX-License-Identifier: Apache-2.0
// `veltractl why`: reads the whole record and prints what is asked for.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "formats/json.h"
#include "support/fate_book.h"
#include "tools/ctl/fate_lines.h"
#include "tools/ctl/fate_source.h"
#include "tools/ctl/fate_text.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {

namespace {

// The missing numbers of messages; files and log data have separate numbers.
struct Gone {
  std::uint64_t messages = 0;
  std::int64_t before = 0;  // they were taken in earlier
};

struct Story {
  Gone gone;
  std::vector<const support::MessageFates*> told;
};

// The messages that the record holds completely, and the number of those that it no longer holds.
Story storyOf(const support::FateBook& book, const FateSource& source, const Options& options) {
  const FateFilter& filter = options.care.fates;
  Story story;
  std::uint64_t whole = 0;
  std::uint64_t taken = source.messages();
  std::vector<const support::MessageFates*> inOrder;
  for (const auto& [number, fates] : book.messages()) {
    const bool isMessage = fates.message.entry.item == wire::MessageEntry::Item::message;
    if (isMessage) taken = std::max(taken, number);
    if (fates.message.position < source.horizon() || !fates.message.session) continue;
    if (isMessage && whole++ == 0) story.gone.before = fates.message.entry.time;
    const bool there = !filter.backend || fates.backends.contains(*filter.backend);
    if (there && fits(filter, fates.message)) story.told.push_back(&fates);
  }
  story.gone.messages = taken - whole;
  if (story.told.size() > options.care.last)
    story.told.erase(story.told.begin(), story.told.end() - static_cast<std::ptrdiff_t>(options.care.last));
  return story;
}

bool printGone(const Gone& gone, bool json) {
  if (gone.messages == 0) return true;
  if (json) {
    return printLine(formats::writeJSON(
        Dictionary{{"gone", Dictionary{{"messages", gone.messages}, {"before", secondsOf(gone.before)}}}}));
  }
  return printLine(fmt::format(
      "{} {} older than {} gone: the record has no room for more.", gone.messages,
      gone.messages == 1 ? "message" : "messages",
      gone.before == 0 ? "now are" : timeOf(gone.before) + (gone.messages == 1 ? " is" : " are")));
}

bool print(const support::MessageFates& fates, const Options& options) {
  if (!options.care.fates.backend)
    return printLine(options.json ? formats::writeJSON(lineOfFates(fates)) : textOfFates(fates));
  support::MessageFates one = fates;
  std::erase_if(one.backends, [&](const auto& entry) { return entry.first != *options.care.fates.backend; });
  return printLine(options.json ? formats::writeJSON(lineOfFates(one)) : textOfFates(one));
}

}  // namespace

int runWhy(ControlClient& daemon, const Options& options) {
  support::FateBook book;
  FateSource source(daemon, book);
  auto done = source.readOn(true);
  if (done && source.waits()) done = source.readOn(false);
  if (!done) return refused(done.error());
  const Story story = storyOf(book, source, options);
  if (!printGone(story.gone, options.json)) return 1;
  for (const support::MessageFates* fates : story.told) {
    if (!print(*fates, options)) return 1;
  }
  if (story.told.empty() && !options.json) remark("No message fits.");
  return 0;
}

}  // namespace veltrad::ctl
