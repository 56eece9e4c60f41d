// SPDX-License-Identifier: Apache-2.0
// Copies options by their version's size, and checks their ranges.
#include "client/session_options.h"

#include <algorithm>
#include <cstring>

#include "client/value_node.h"

namespace veltrad::client {

namespace {

constexpr std::int32_t kLastClientType = VELTRA_CLIENT_TYPE_LIMBET;
constexpr std::uint32_t kAllFlags = VELTRA_FLAG_REALTIME | VELTRA_FLAG_OVERRIDE_SAMPLING;

std::string outside(const char* what, const std::string& given, std::int64_t last) {
  return std::string("The ") + what + " " + given + " is outside the range 0 to " + std::to_string(last) +
         ".";
}

}  // namespace

std::optional<veltra_session_options> completeOptions(const veltra_session_options* given) {
  if (!given || given->size < kFieldsOf80) return std::nullopt;
  const std::size_t bytes = given->size <= kSizeOf80 ? kFieldsOf80 : std::min(given->size, sizeof *given);
  veltra_session_options whole{};
  std::memcpy(&whole, given, bytes);
  whole.size = sizeof whole;
  return whole;
}

std::optional<std::string> problemOfDescription(const veltra_session_options& options) {
  if (options.has_client_type && (options.client_type < 0 || options.client_type > kLastClientType)) {
    return outside("client type", std::to_string(options.client_type), kLastClientType);
  }
  if (options.user_info && !options.user_info->entries()) return "The user info is no dictionary.";
  if (options.frameworks_to_check && !options.frameworks_to_check->items()) {
    return "The frameworks to check are no array.";
  }
  return std::nullopt;
}

std::optional<std::string> problemOfFlag(std::uint32_t flag) {
  if (flag <= kAllFlags) return std::nullopt;
  return outside("flag", std::to_string(flag), kAllFlags);
}

}  // namespace veltrad::client

void veltra_session_options_init(veltra_session_options* options) {
  if (!options) return;
  *options = veltra_session_options{};
  options->size = sizeof *options;
}
