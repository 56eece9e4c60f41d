// SPDX-License-Identifier: Apache-2.0
// Writes the live page.
#include "page.h"

#include "arrivals.h"
#include "base/text.h"

namespace veltrad::lab {
namespace {

std::string listed(const char* title, const Received& received) {
  std::string html = std::string("<h2>") + title + ", the newest first</h2>\n";
  const auto lines = received.newest();
  if (lines.empty()) html += "<p>nothing yet</p>\n";
  for (const auto& line : lines) html += "<pre>" + escapedForHTML(line) + "</pre>\n";
  return html;
}

}  // namespace

std::string escapedForHTML(const std::string& text) {
  std::string escaped;
  for (const char c : toUTF8(text)) {
    if (c == '<')
      escaped += "&lt;";
    else if (c == '>')
      escaped += "&gt;";
    else if (c == '&')
      escaped += "&amp;";
    else if (c == '"')
      escaped += "&quot;";
    else
      escaped += c;
  }
  return escaped;
}

std::string livePage(const std::vector<std::string>& addresses, Arrivals& arrivals) {
  std::string html =
      "<!DOCTYPE html>\n<html lang=\"en\"><head><meta charset=\"utf-8\"><meta http-equiv=\"refresh\" "
      "content=\"2\"><title>veltra-lab</title>\n<style>body{font:14px sans-serif;margin:2em}"
      "pre{white-space:pre-wrap;overflow-wrap:anywhere;background:#f2f2f2;padding:.5em}</style></head>\n"
      "<body><h1>veltra-lab</h1>\n<ul>\n";
  for (const auto& address : addresses) html += "<li>" + escapedForHTML(address) + "</li>\n";
  html += "</ul>\n";
  for (const auto& kind : arrivals.kinds()) html += listed(kind.title, kind.lines);
  return html + "</body></html>\n";
}

}  // namespace veltrad::lab
