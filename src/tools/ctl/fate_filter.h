// SPDX-License-Identifier: Apache-2.0
// Selects the messages that `veltractl why` and `watch` show. Pure functions.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace veltrad::support {
struct ToldMessage;
}  // namespace veltrad::support

namespace veltrad::ctl {

// Absent values match every message; texts and numbers must be equal.
struct FateFilter {
  std::optional<std::uint64_t> message;
  std::optional<std::int32_t> clientType;
  std::optional<std::uint32_t> sessionID;
  std::optional<std::uint16_t> clientVersion;
  std::optional<std::string> client;
  std::optional<std::string> service;
  std::optional<std::uint16_t> category;
  std::optional<std::uint16_t> type;
  std::optional<std::int32_t> flag;
  std::optional<std::string> backend;  // which the message came to
  bool uploads = false;                // files and log data instead of messages
};

// Compares everything except the back end.
bool fits(const FateFilter& filter, const support::ToldMessage& message);

}  // namespace veltrad::ctl
