// SPDX-License-Identifier: Apache-2.0
// Reads the contents of messages from the daemon. One thread.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/control_client.h"

namespace veltrad::ctl {

// The daemon keeps the contents of messages from the first call of readOn() until the connection ends.
class ContentsSource {
 public:
  // Outlives it.
  explicit ContentsSource(ControlClient& daemon) : _daemon(daemon) {}

  // Reads what has come since the last call. The error is one line.
  Result<Done, std::string> readOn();
  // "payload" and "userInfo" of a message of the record, once; absent if they are lost. Reads further
  // contents if necessary.
  Result<std::optional<Dictionary>, std::string> of(std::uint64_t message);

 private:
  // The bound for contents that were not asked for yet; those with the lowest numbers are dropped first.
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
