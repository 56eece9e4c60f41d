// SPDX-License-Identifier: Apache-2.0
// Asks the daemon what messages hold. One thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/control_client.h"

namespace veltrad::ctl {

// The daemon keeps what messages hold from the first call of readOn() until the client's connection ends.
class ContentsSource {
 public:
  // Outlives it.
  explicit ContentsSource(ControlClient& daemon) : _daemon(daemon) {}

  // Reads what has come since the last call. The error is one line.
  Result<Done, std::string> readOn();
  // "payload" and "userInfo" of a message that the record tells of, once; nothing if they are lost. Reads on
  // where necessary.
  Result<std::optional<Dictionary>, std::string> of(std::uint64_t message);

 private:
  // Of messages that nobody has asked for yet; those with the lowest numbers make room.
  static constexpr std::size_t kMostBytes = 8u << 20;
  // Sessions send at the same time, so that the order of numbers is nearly that of arrival.
  static constexpr std::uint64_t kDisorder = 4096;

  void take(const Dictionary& piece);
  std::optional<Dictionary> taken(std::uint64_t message);

  ControlClient& _daemon;
  std::optional<std::uint64_t> _next;          // nothing: not begun
  std::map<std::uint64_t, std::string> _held;  // property lists, by message
  std::size_t _bytes = 0;
  std::uint64_t _highest = 0;  // of the messages that came
};

}  // namespace veltrad::ctl
