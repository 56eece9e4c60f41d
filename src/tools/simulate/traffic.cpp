// SPDX-License-Identifier: Apache-2.0
// Counts by the second.
#include "traffic.h"

#include <algorithm>

namespace veltrad::simulate {

namespace {
constexpr const char* kNames[] = {"storebags", "collector", "dashboards"};
constexpr std::size_t kMinute = 60;

std::size_t secondOf(Tick tick) {
  return tick / kTicksPerSecond;
}
}  // namespace

Traffic::Traffic(double seconds, double keepAlive) : _keepAlive(tickAt(keepAlive)) {
  const std::size_t size = secondOf(tickAt(seconds)) + 1;
  for (auto& one : _sent) one.resize(size);
  for (auto& one : _opened) one.resize(size);
}

void Traffic::sent(Server server, Tick now) {
  ++_sent[static_cast<std::size_t>(server)][secondOf(now)];
}

void Traffic::answered(Server server, Tick now, Tick& open) {
  auto& opened = _opened[static_cast<std::size_t>(server)];
  const auto change = [&opened](Tick at, std::int32_t by) {
    if (secondOf(at) < opened.size()) opened[secondOf(at)] += by;
  };
  change(std::max(now, open), 1);
  open = now + _keepAlive;
  change(open, -1);
}

Dictionary Traffic::report() const {
  Dictionary all;
  for (std::size_t server = 0; server < kServers; ++server) {
    Array sent;
    Array connections;
    std::int64_t open = 0;
    for (std::size_t second = 0; second + 1 < _sent[server].size(); ++second) {
      sent.emplace_back(_sent[server][second]);
      open += _opened[server][second];
      if (second % kMinute == 0) connections.emplace_back(open);
    }
    all.set(kNames[server], Dictionary{{"sent", std::move(sent)}, {"connections", std::move(connections)}});
  }
  return all;
}

}  // namespace veltrad::simulate
