// SPDX-License-Identifier: Apache-2.0
// Describes a departure in readable text.
#include "tools/ctl/history_text.h"

#include <fmt/format.h>

#include <array>
#include <cmath>
#include <ctime>

#include "base/text.h"
#include "tools/ctl/answer_fields.h"

namespace veltrad::ctl {

namespace {

std::optional<std::int64_t> numberOrNone(const Dictionary& from, const char* key) {
  const Value* value = from.find(key);
  const auto real = value ? value->asReal() : nullptr;
  if (!value || (real && !std::isfinite(*real))) return std::nullopt;
  return value->toInt64();
}

std::string nameList(const HistoryItem& item, const char* key) {
  std::string all;
  for (const Value& name : arrayIn(item.facts, key))
    all += (all.empty() ? "" : ", ") + escapedForLog(name.asString() ? *name.asString() : "");
  return all;
}

}  // namespace

std::string timeText(double secondsSince1970) {
  const auto seconds = static_cast<std::time_t>(secondsSince1970);
  std::tm parts{};
  ::localtime_r(&seconds, &parts);
  std::array<char, 32> text{};
  return {text.data(), std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M:%S", &parts)};
}

std::string whatOf(const HistoryItem& item) {
  const std::string kind = item.text("kind");
  if (kind == "datagram") return "a datagram";
  if (kind == "file") return "a file";
  if (kind == "logData") return "log data";
  const auto events = numberIn(item.facts, "events");
  return fmt::format("{} event{}", events, events == 1 ? "" : "s");
}

std::string outcomeOf(const HistoryItem& item) {
  const auto transmissions = numberOrNone(item.facts, "transmissions").value_or(1);
  std::string text = transmissions > 1 ? fmt::format("sent {} times", transmissions) : "";
  const auto add = [&text](const std::string& more) { text += (text.empty() ? "" : ", ") + more; };
  if (const auto status = numberOrNone(item.facts, "status")) add(fmt::format("HTTP {}", *status));
  if (const std::string error = item.text("error"); !error.empty()) add(escapedForLog(error));
  if (text.empty()) return item.text("kind") == "datagram" ? "sent" : "the outcome is not known";
  return text;
}

std::string whoseOf(const HistoryItem& item) {
  const std::string client = item.text("client"), service = item.text("service");
  if (!client.empty()) return escapedForLog(service.empty() ? client : client + "/" + service);
  const auto type = numberOrNone(item.facts, "clientType");
  return type ? fmt::format("client type {}", *type) : "an unknown client";
}

std::string lineOfItem(const HistoryItem& item) {
  return fmt::format("{}  {}  {} to {} ({} bytes) of {}: {}", item.text("id"), timeText(item.time()),
                     whatOf(item), escapedForLog(item.text("to")), numberIn(item.facts, "bytes"),
                     whoseOf(item), outcomeOf(item));
}

std::vector<std::pair<std::string, std::string>> detailsOf(const HistoryItem& item) {
  std::vector<std::pair<std::string, std::string>> details;
  const auto add = [&details](const char* name, std::string text) {
    if (!text.empty()) details.emplace_back(name, std::move(text));
  };
  add("back end", escapedForLog(item.text("backend")));
  if (const auto id = numberOrNone(item.facts, "sessionID")) add("session", fmt::format("{}", *id));
  if (const Dictionary* storebag = item.facts.dictionary("storebag")) {
    std::string let;
    for (const char* key : {"name", "version", "section"}) {
      const std::string* part = storebag->string(key);
      if (part) let += (let.empty() ? "" : ", ") + std::string(key) + " " + escapedForLog(*part);
    }
    if (const auto entry = numberOrNone(item.facts, "entry")) let += fmt::format(", client entry {}", *entry);
    add("storebag", std::move(let));
  }
  add("removed", nameList(item, "removed"));
  add("hashed", nameList(item, "hashed"));
  return details;
}

std::string headOfItem(const HistoryItem& item) {
  std::string head = lineOfItem(item);
  for (const auto& [name, text] : detailsOf(item)) head += fmt::format("\n{:<12}{}", name, text);
  if (!item.headers.empty()) head += "\n";
  for (const Value& line : item.headers) {
    if (line.asString()) head += "\n" + escapedForLog(*line.asString());
  }
  return head;
}

std::string withoutBody(const HistoryItem& item) {
  return fmt::format("The body was too large to be kept: {} bytes, SHA-256 {}", numberIn(item.facts, "bytes"),
                     item.digest.value_or("unknown"));
}

}  // namespace veltrad::ctl
