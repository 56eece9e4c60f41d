// SPDX-License-Identifier: Apache-2.0
// Adds up by client.
#include "config/drop_receipt.h"

#include <utility>

#include "base/null_value.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::config {

namespace {

// Programs choose their names, and the answer is to fit a frame.
constexpr std::size_t kMostClients = 1024;
constexpr std::size_t kMostOfName = 128;

Value shortened(const Value* value) {
  if (!value) return nullValue();
  const std::string* text = value->asString();
  if (!text || text->size() <= kMostOfName) return *value;
  return std::string(withoutIncompleteEnd(std::string_view(*text).substr(0, kMostOfName))) + "…";
}

Dictionary whoseOf(const Dictionary* client) {
  Dictionary whose;
  for (const char* key : {"clientType", "sessionID", "client", "service"})
    whose.set(key, shortened(client ? client->find(key) : nullptr));
  return whose;
}

}  // namespace

void DropReceipt::begin() {
  const Lock held(_mutex);
  _lines.clear();
  _open.store(true, std::memory_order_release);
}

void DropReceipt::addUp(Kind kind, const std::shared_ptr<const Dictionary>& client, std::uint64_t count) {
  if (count == 0) return;
  Dictionary whose = whoseOf(client.get());
  std::string text = formats::writeJSON(whose);
  const Lock held(_mutex);
  if (_lines.size() >= kMostClients && !_lines.contains(text)) {
    whose = whoseOf(nullptr);
    text = formats::writeJSON(whose);
  }
  Line& line = _lines[std::move(text)];
  line.client = std::move(whose);
  line.counts[static_cast<std::size_t>(kind)] += count;
}

void DropReceipt::put(const std::array<std::uint64_t, 4>& counts, Dictionary& into) {
  into.set("events", counts[static_cast<std::size_t>(Kind::post)]);
  into.set("datagrams", counts[static_cast<std::size_t>(Kind::datagram)]);
  into.set("files", counts[static_cast<std::size_t>(Kind::file)]);
}

Dictionary DropReceipt::end() {
  std::map<std::string, Line> lines;
  {
    const Lock held(_mutex);
    _open.store(false, std::memory_order_release);
    lines.swap(_lines);
  }
  std::array<std::uint64_t, 4> sums{};
  Array byClient;
  for (auto& [text, line] : lines) {
    for (std::size_t i = 0; i < sums.size(); ++i) sums[i] += line.counts[i];
    put(line.counts, line.client);
    byClient.push_back(std::move(line.client));
  }
  Dictionary receipt{{"byClient", std::move(byClient)}};
  put(sums, receipt);
  return receipt;
}

}  // namespace veltrad::config
