// SPDX-License-Identifier: Apache-2.0
// Counts the load of the servers: requests and datagrams of each second, and open connections.
#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "base/value.h"
#include "calendar.h"

namespace veltrad::simulate {

enum class Server : std::uint8_t { storebags, collector, dashboards };

class Traffic {
 public:
  // `seconds`: of the simulation; `keepAlive`: until a server closes an idle connection.
  Traffic(double seconds, double keepAlive);

  // Something is sent to the server, whether or not it is there.
  void sent(Server server, Tick now);
  // A request on a connection of one device that stays open until `open`, or on a new one.
  void answered(Server server, Tick now, Tick& open);

  // By the server's name: "sent", an array of the numbers of each second, and "connections", of each minute.
  Dictionary report() const;

 private:
  static constexpr std::size_t kServers = 3;
  const Tick _keepAlive;
  std::array<std::vector<std::uint32_t>, kServers> _sent;  // by second
  // By second: how many connections are opened, less those that are closed.
  std::array<std::vector<std::int32_t>, kServers> _opened;
};

}  // namespace veltrad::simulate
