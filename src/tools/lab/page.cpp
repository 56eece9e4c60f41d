// SPDX-License-Identifier: Apache-2.0
// Writes the live page.
#include "page.h"

#include "arrivals.h"
#include "base/text.h"
#include "tools/markup.h"

namespace veltrad::lab {
namespace {

// Clients may send any bytes.
std::string html(const std::string& text) {
  return tools::escapedForMarkup(toUTF8(text));
}

std::string listed(const char* title, const Received& received) {
  std::string page = std::string("<h2>") + title + ", the newest first</h2>\n";
  const auto lines = received.newest();
  if (lines.empty()) page += "<p>nothing yet</p>\n";
  for (const auto& line : lines) page += "<pre>" + html(line) + "</pre>\n";
  return page;
}

}  // namespace

std::string livePage(const std::vector<std::string>& addresses, Arrivals& arrivals) {
  std::string page =
      "<!DOCTYPE html>\n<html lang=\"en\"><head><meta charset=\"utf-8\"><meta http-equiv=\"refresh\" "
      "content=\"2\"><title>veltra-lab</title>\n<style>body{font:14px sans-serif;margin:2em}"
      "pre{white-space:pre-wrap;overflow-wrap:anywhere;background:#f2f2f2;padding:.5em}</style></head>\n"
      "<body><h1>veltra-lab</h1>\n<ul>\n";
  for (const auto& address : addresses) page += "<li>" + html(address) + "</li>\n";
  page += "</ul>\n";
  for (const auto& kind : arrivals.kinds()) page += listed(kind.title, kind.lines);
  return page + "</body></html>\n";
}

}  // namespace veltrad::lab
