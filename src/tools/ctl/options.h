// The command line of veltractl. Pure; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "base/value.h"

namespace veltrad::ctl {

// What a session says of itself; what is absent is left out of its session info.
struct Identity {
  std::optional<std::int32_t> clientType;  // 0 to 17 are defined; the daemon takes any
  std::optional<std::uint32_t> sessionID;
  std::optional<std::uint16_t> clientVersion;
  bool requireUserInfo = false;
  bool batchEvents = false;
  // With "clientName" and "serviceName" among the rest. Absent without --client, --service and --user-info.
  std::optional<Dictionary> userInfo;
};

enum class Command {
  session,
  send,
  oneShot,
  states,
  displayURL,
  upload,
  uploadLogData,
  stats,
  status,
  metrics
};

struct Options {
  Command command = Command::session;
  std::optional<std::string> root;  // absent: VELTRA_ROOT, else "/"
  bool json = false;
  Identity identity;                  // of what opens a session
  bool aggregate = false;             // session
  std::optional<std::string> input;   // session: a file; absent: standard input
  std::uint16_t category = 0;         // send, oneShot
  std::uint16_t type = 0;             // likewise
  std::uint32_t flag = 0;             // send
  std::optional<Dictionary> payload;  // send, oneShot; absent without KEY=VALUE
  std::string file;                   // upload, uploadLogData
  bool watch = false;                 // status
};

// What to print instead of running: help, version, or what is wrong with the command line.
struct Ending {
  int status = 0;  // 0, or 2 for wrong usage
  std::string output;
  std::string errorOutput;
};

std::variant<Options, Ending> parseOptions(int argc, const char* const* argv);

}  // namespace veltrad::ctl
