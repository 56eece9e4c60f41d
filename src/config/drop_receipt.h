// SPDX-License-Identifier: Apache-2.0
// Counts what is dropped while the owner of the device turns reporting off. Any thread.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "base/mutex.h"
#include "base/value.h"
#include "http/request_gate.h"

namespace veltrad::config {

class DropReceipt {
 public:
  // Starts counting, until end().
  void begin();
  // `client`: as in Departure. Costs one comparison while no receipt is open.
  void add(http::Departure::Kind kind, const std::shared_ptr<const Dictionary>& client, std::uint64_t count) {
    if (_open.load(std::memory_order_acquire)) addUp(kind, client, count);
  }
  // {"events", "datagrams", "files", "byClient": [the client's keys and these three]}. Long names are
  // truncated, and beyond the bound all further clients are one entry without a name.
  Dictionary end();

 private:
  using Kind = http::Departure::Kind;
  struct Line {
    Dictionary client;
    std::array<std::uint64_t, 4> counts{};  // by kind
  };
  void addUp(Kind kind, const std::shared_ptr<const Dictionary>& client, std::uint64_t count);
  static void put(const std::array<std::uint64_t, 4>& counts, Dictionary& into);

  std::atomic<bool> _open{false};
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  // By the client's JSON text.
  std::map<std::string, Line> _lines GUARDED_BY(_mutex);
};

}  // namespace veltrad::config
