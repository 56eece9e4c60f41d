// SPDX-License-Identifier: Apache-2.0
// The process at the other end of a Unix socket, as the kernel knew it when it connected.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/result.h"

namespace veltrad::ipc {

struct Peer {
  unsigned uid = 0;
  // The effective group, then the supplementary ones.
  std::vector<unsigned> gids;
  // For log lines only.
  int pid = 0;
  // The system unit ("veltra-agent.service") by the control group, read while the pidfd shows that the peer
  // is alive. Absent if there is none, for a unit of a user manager, a dead peer, or a kernel without
  // SO_PEERPIDFD.
  std::optional<std::string> unit;
};

// Only the peer's user, effective group and process, with one system call.
Result<Peer, std::string> credentialsOfSocket(int socket);
// All fields. Fails also if a shortage prevents the look-up of the unit.
Result<Peer, std::string> peerOfSocket(int socket);
// True for root and the daemon's own user, which may read and change its files anyway.
bool isOwner(unsigned uid);
// False only on kernels that cannot say which unit a peer belongs to.
bool kernelTellsUnits();
// The unit in a control group path ("/system.slice/x.service"). Exposed for tests.
std::optional<std::string> systemUnitOfControlGroup(const std::string& path);

}  // namespace veltrad::ipc
