// Who is at the other end of a Unix socket, by the kernel's word at the time it connected. Any thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/result.h"

namespace veltrad::ipc {

struct Peer {
  unsigned uid = 0;
  std::vector<unsigned> gids;  // effective first, then the supplementary ones
  int pid = 0;                 // for log lines only; 0 where the kernel does not say
  // The system unit ("veltra-agent.service") from the control group, read while the peer's pidfd shows it
  // alive. Absent: none, a unit of a user manager, a dead peer, or a kernel without SO_PEERPIDFD.
  std::optional<std::string> unit;
};

// The peer's user, effective group and process alone: one question to the kernel.
Result<Peer, std::string> credentialsOfSocket(int socket);
// All of it. Fails also where the unit cannot be asked for just now, for want of a descriptor.
Result<Peer, std::string> peerOfSocket(int socket);
// Root, and the user that the daemon runs as, who may read and change its files anyway.
bool isOwner(unsigned uid);
// False only on kernels that cannot say which unit a peer belongs to.
bool kernelTellsUnits();
// The unit in a control group path ("/system.slice/x.service"); exposed for its table of tests.
std::optional<std::string> systemUnitOfControlGroup(const std::string& path);

}  // namespace veltrad::ipc
