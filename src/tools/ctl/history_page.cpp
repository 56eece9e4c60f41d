// SPDX-License-Identifier: Apache-2.0
// Writes the page piece by piece, because a history may be large.
#include "tools/ctl/history_page.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <map>

#include "base/base64.h"
#include "base/file_descriptor.h"
#include "base/text.h"
#include "http/host_name.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/history_text.h"
#include "tools/ctl/readable_body.h"
#include "tools/markup.h"

namespace veltrad::ctl {

namespace {

constexpr std::size_t kMostReadable = 256u << 10;
constexpr std::size_t kMostEmbedded = 1u << 20;

constexpr const char* kHead = R"(<!DOCTYPE html>
<html lang="en">
<head>
<meta charset="utf-8">
<meta name="viewport" content="width=device-width, initial-scale=1">
<meta http-equiv="Content-Security-Policy" content="default-src 'none'; style-src 'unsafe-inline'">
<title>What left this device</title>
<style>
:root { color-scheme: light dark; --line: #8884; --soft: #8882; --good: #1a7f37; --bad: #b3261e }
@media (prefers-color-scheme: dark) { :root { --good: #57c878; --bad: #ff8a80 } }
* { box-sizing: border-box }
body { margin: 0 auto; max-width: 64rem; padding: 1rem; font: 1rem/1.5 system-ui, sans-serif }
h1 { font-size: 1.5rem; margin: .5rem 0 0 }
h2 { font-size: 1.15rem; margin: 2rem 0 .5rem; position: sticky; top: 0; background: Canvas; padding: .3rem 0 }
h3 { font-size: 1rem; margin: 1rem 0 .25rem }
summary { cursor: pointer; padding: .5rem; border-radius: .4rem; display: flex; flex-wrap: wrap; gap: 0 1rem }
summary::before { content: "▸"; width: .8em }
details[open] > summary::before { content: "▾" }
summary:hover { background: var(--soft) }
summary:focus-visible, a:focus-visible, pre:focus-visible { outline: 3px solid #3b82f6; outline-offset: 1px }
.to { border: 1px solid var(--line); border-radius: .5rem; margin: .5rem 0; padding: 0 .5rem .5rem }
.to > summary { font-weight: 600; overflow-wrap: anywhere }
.to > summary span { font-weight: 400 }
.item { border-top: 1px solid var(--line) }
.item > div { padding: 0 .5rem 1rem }
.ends { margin-left: auto }
.good { color: var(--good) } .bad { color: var(--bad) }
time { font-variant-numeric: tabular-nums }
dl { display: grid; grid-template-columns: max-content 1fr; gap: .1rem 1rem; margin: .5rem 0 }
dd { margin: 0; overflow-wrap: anywhere }
pre { background: var(--soft); padding: .6rem; border-radius: .4rem; overflow: auto; max-height: 30rem; margin: .5rem 0;
      font: .85rem/1.45 ui-monospace, monospace; white-space: pre-wrap; overflow-wrap: anywhere }
@media (max-width: 36rem) { dl { grid-template-columns: 1fr } dt { font-weight: 600; margin-top: .3rem } .ends { margin-left: 1.8em } }
</style>
</head>
<body>
<h1>What left this device</h1>
)";

std::string html(std::string_view text) {
  return tools::escapedForMarkup(text);
}

std::int64_t bytesOf(const HistoryItem& item) {
  return numberIn(item.facts, "bytes");
}

class Page {
 public:
  Page(FileDescriptor file, const BodyOf& bodyOf) : _file(std::move(file)), _bodyOf(bodyOf) {}

  using Items = std::vector<const HistoryItem*>;
  void day(const std::string& name, const Items& items) {
    put("<section>\n<h2>" + html(name) + "</h2>\n");
    std::map<std::string, Items> byAddress;
    for (const HistoryItem* item : items)
      byAddress[std::string(http::addressOf(item->text("to")))].push_back(item);
    for (const auto& [address, sent] : byAddress) destination(address, sent);
    put("</section>\n");
  }
  void put(const std::string& text) {
    if (_error == 0) _error = writeAll(_file.get(), text);
  }
  // An errno.
  int error() const { return _error; }

 private:
  void destination(const std::string& address, const Items& items) {
    std::int64_t bytes = 0;
    std::map<std::string, Items> byClient;
    for (const HistoryItem* item : items) {
      bytes += bytesOf(*item);
      byClient[whoseOf(*item)].push_back(item);
    }
    put(fmt::format("<details class=\"to\" open>\n<summary>{}<span>{} sent, {} bytes</span></summary>\n",
                    html(address), items.size(), bytes));
    for (const auto& [client, sent] : byClient) {
      put("<h3>" + html(client) + "</h3>\n");
      for (const HistoryItem* item : sent) entry(*item);
    }
    put("</details>\n");
  }

  void entry(const HistoryItem& item) {
    const std::string when = timeText(item.time());
    const std::string error = item.text("error");
    const auto status = item.facts.int32("status");
    const bool good = error.empty() && (!status || *status < 300);
    put(fmt::format(
        "<details class=\"item\" id=\"{0}\">\n<summary><time>{1}</time><span>{2}, {3} bytes</span>"
        "<span class=\"ends {4}\">{5}</span></summary>\n<div>\n",
        html(item.text("id")), html(when.substr(std::min<std::size_t>(11, when.size()))), html(whatOf(item)),
        bytesOf(item), good ? "good" : "bad", html(outcomeOf(item))));
    put("<dl><dt>ID</dt><dd>" + html(item.text("id")) + "</dd><dt>to</dt><dd>" + html(item.text("to")) +
        "</dd>");
    for (const auto& [name, text] : detailsOf(item))
      put("<dt>" + html(name) + "</dt><dd>" + html(text) + "</dd>");
    put("</dl>\n");
    if (!item.headers.empty()) {
      std::string lines;
      for (const Value& line : item.headers) lines += (line.asString() ? *line.asString() : "") + "\n";
      put("<pre tabindex=\"0\" aria-label=\"Headers\">" + html(lines) + "</pre>\n");
    }
    body(item);
    put("</div>\n</details>\n");
  }

  void body(const HistoryItem& item) {
    const auto bytes =
        item.digest ? Result<std::string, std::string>(Failure{withoutBody(item)}) : _bodyOf(item);
    if (!bytes) return put("<p>" + html(bytes.error()) + "</p>\n");
    std::string readable = readableBody(item.text("kind"), bytes.value());
    if (readable.size() > kMostReadable) {
      readable = withoutIncompleteEnd(readable.substr(0, kMostReadable));
      readable += "\n… the rest: veltractl history show " + item.text("id");
    }
    put("<pre tabindex=\"0\" aria-label=\"Body\">" + html(readable) + "</pre>\n");
    if (bytes.value().size() > kMostEmbedded) return;
    put(fmt::format(
        "<p><a download=\"{}.bin\" href=\"data:application/octet-stream;base64,{}\">The bytes as they "
        "left</a></p>\n",
        html(item.text("id")), encodeBase64(bytes.value())));
  }

  const FileDescriptor _file;
  const BodyOf& _bodyOf;
  int _error = 0;
};

}  // namespace

Result<Done, std::string> writeHistoryPage(const std::string& path, const std::vector<HistoryItem>& items,
                                           const BodyOf& bodyOf) {
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (!file.isOpen()) return Failure{path + ": " + std::strerror(errno)};
  std::map<std::string, Page::Items, std::greater<>> byDay;
  for (const HistoryItem& item : items) byDay[timeText(item.time()).substr(0, 10)].push_back(&item);
  Page page(std::move(file), bodyOf);
  page.put(kHead);
  page.put(fmt::format("<p>{} records, as of {}. Times are those of this device.</p>\n<main>\n", items.size(),
                       timeText(static_cast<double>(std::time(nullptr)))));
  for (const auto& [day, sent] : byDay) page.day(day, sent);
  page.put("</main>\n</body>\n</html>\n");
  if (page.error() == 0) return Done();
  ::unlink(path.c_str());
  return Failure{path + ": " + std::strerror(page.error())};
}

}  // namespace veltrad::ctl
