// SPDX-License-Identifier: Apache-2.0
// The command line of veltractl.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "base/value.h"
#include "tools/command_line.h"
#include "tools/ctl/fate_filter.h"

namespace veltrad::ctl {

// The exit status of a command line that cannot be used.
inline constexpr int kWrongUsage = 2;

// The content of the session info. Absent values are left out.
struct Identity {
  std::optional<std::int32_t> clientType;
  std::optional<std::uint32_t> sessionID;
  std::optional<std::uint16_t> clientVersion;
  bool requireUserInfo = false;
  bool batchEvents = false;
  // From --client, --service and --user-info.
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
  metrics,
  doctor,
  config,
  configGet,
  configSet,
  configUnset,
  refresh,
  report,
  privacy,
  privacyOff,
  privacyOn,
  privacyReset,
  history,
  historyShow,
  historyPurge,
  spool,
  spoolSend,
  spoolDrop,
  why,
  watch
};

// Options of the commands for administrators.
struct Care {
  bool watch = false;
  // doctor.
  std::vector<std::int32_t> clientTypes;
  // config: a preference's name; refresh: a storebag's, empty for all; history show: a record's.
  std::string key;
  std::string value;
  // report: the file to write.
  std::optional<std::string> output;
  bool yes = false;
  // history show: the bytes as they left.
  bool raw = false;
  // history: the page to write.
  std::optional<std::string> html;
  // spool drop: the posts.
  std::vector<std::string> ids;
  // why, watch.
  FateFilter fates;
  std::size_t last = 20;
  // watch: also what the messages hold.
  bool contents = false;
};

// Its 13 fields are the command's options and arguments, by name.
struct Options {
  Command command = Command::session;
  std::optional<std::string> root;
  bool json = false;
  Identity identity;
  bool aggregate = false;
  std::optional<std::string> input;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::uint32_t flag = 0;
  std::optional<Dictionary> payload;
  // send: it has failed unless a back end reports the message.
  bool expectReported = false;
  std::string file;
  Care care;
};

// What to print instead of running: help, version, or what is wrong with the command line. The status is 2
// for wrong usage.
struct Ending {
  int status = 0;
  std::string output;
  std::string errorOutput;
};

std::variant<Options, Ending> parseOptions(int argc, const char* const* argv);

// For the reference pages.
tools::CommandLine commandLine();

}  // namespace veltrad::ctl
