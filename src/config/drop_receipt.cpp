// SPDX-License-Identifier: Apache-2.0
// Adds up by client.
#include "config/drop_receipt.h"

#include <limits>
#include <utility>

#include "formats/json.h"

namespace veltrad::config {

void DropReceipt::begin() {
  const Lock held(_mutex);
  _lines.clear();
  _open.store(true, std::memory_order_release);
}

void DropReceipt::addUp(Kind kind, const std::shared_ptr<const Dictionary>& client, std::uint64_t count) {
  if (count == 0) return;
  Dictionary whose;
  for (const char* key : {"clientType", "sessionID", "client", "service"}) {
    const Value* value = client ? client->find(key) : nullptr;
    whose.set(key, value ? *value : Value(std::numeric_limits<double>::quiet_NaN()));
  }
  std::string text = formats::writeJSON(whose);
  const Lock held(_mutex);
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
