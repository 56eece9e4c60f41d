// SPDX-License-Identifier: Apache-2.0
// Requests all pages, and joins the two records of each departure.
#include "tools/ctl/history_client.h"

#include <map>

#include "base/null_value.h"
#include "tools/ctl/answer_fields.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

constexpr std::chrono::seconds kHistoryPatience{30};
constexpr const char* kKeys[] = {"id",      "time",       "kind",      "to",      "bytes",
                                 "events",  "clientType", "sessionID", "client",  "service",
                                 "backend", "storebag",   "entry",     "removed", "hashed"};
constexpr const char* kEndKeys[] = {"status", "error", "transmissions"};

HistoryItem itemOf(const Dictionary& record) {
  HistoryItem item;
  for (const char* key : kKeys) item.facts.set(key, orNull(record.find(key)));
  for (const char* key : {"status", "error"}) item.facts.set(key, nullValue());
  item.facts.set("transmissions", 1);
  item.headers = arrayIn(record, "headers");
  item.day = orNull(record.find("day"));
  item.offset = orNull(record.find("offset"));
  const std::string* digest = record.string("sha256");
  if (digest) item.digest = *digest;
  if (!record.boolean("kept").value_or(true)) {
    item.facts.set("kept", false);
    item.facts.set("sha256", orNull(record.find("sha256")));
    if (!digest) item.digest = "unknown";
  }
  return item;
}

}  // namespace

std::string HistoryItem::text(const char* key) const {
  const std::string* found = facts.string(key);
  return found ? *found : std::string();
}

Result<std::vector<HistoryItem>, std::string> askForHistory(ControlClient& daemon) {
  std::vector<HistoryItem> items;
  std::map<std::string, std::size_t> places;
  Dictionary next;
  do {
    auto page = daemon.ask(wire::question::kHistory, next, kHistoryPatience);
    if (!page) return Failure{page.error()};
    for (const Dictionary* record : dictionariesIn(page.value(), "records")) {
      const std::string* id = record->string("id");
      const std::string* end = record->string("end");
      if (id) {
        places[*id] = items.size();
        items.push_back(itemOf(*record));
      } else if (const auto begun = end ? places.find(*end) : places.end(); begun != places.end()) {
        for (const char* key : kEndKeys) items[begun->second].facts.set(key, orNull(record->find(key)));
      }
    }
    const Dictionary* following = page.value().dictionary("next");
    next = following ? *following : Dictionary();
  } while (!next.empty());
  return items;
}

Result<std::string, std::string> askForBody(ControlClient& daemon, const HistoryItem& item) {
  std::string body;
  for (;;) {
    const auto answer =
        daemon.ask(wire::question::kHistoryBody,
                   {{"day", item.day}, {"offset", item.offset}, {"from", body.size()}}, kHistoryPatience);
    if (!answer) return Failure{answer.error()};
    const Value* bytes = answer.value().find("bytes");
    const Value* size = answer.value().find("size");
    const Data* piece = bytes ? bytes->asData() : nullptr;
    const auto all = size ? size->toInt64() : std::nullopt;
    if (!piece || !all) return Failure{std::string("veltrad answered without the bytes.")};
    body += piece->bytes;
    if (body.size() >= static_cast<std::size_t>(*all)) return body;
    if (piece->bytes.empty()) return Failure{std::string("The record was removed meanwhile.")};
  }
}

}  // namespace veltrad::ctl
