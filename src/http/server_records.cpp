// SPDX-License-Identifier: Apache-2.0
// One entry for each address, within a bound.
#include "http/server_records.h"

#include <algorithm>

#include "http/host_name.h"

namespace veltrad::http {

void ServerRecords::ended(const std::string& host, bool success, double now) {
  const Lock held(_mutex);
  Entry& entry = _entries[host.substr(0, kMostOfAddress)];
  entry.lastUse = ++_uses;
  if (success) {
    entry.lastSuccess = now;
    entry.failures = 0;
  } else {
    ++entry.failures;
  }
  if (_entries.size() <= kMost) return;
  _entries.erase(std::min_element(_entries.begin(), _entries.end(), [](const auto& a, const auto& b) {
    return a.second.lastUse < b.second.lastUse;
  }));
}

std::vector<ServerRecord> ServerRecords::all() const {
  std::vector<ServerRecord> records;
  const Lock held(_mutex);
  for (const auto& [host, entry] : _entries)
    records.push_back({"https://" + host, entry.lastSuccess, entry.failures});
  return records;
}

}  // namespace veltrad::http
