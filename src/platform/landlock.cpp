// SPDX-License-Identifier: Apache-2.0
// Landlock's three system calls.
#include "platform/landlock.h"

#include <sys/syscall.h>
#include <unistd.h>

namespace veltrad::platform::landlock {

namespace {

// The same numbers on every architecture.
constexpr long kCreateRuleset = 444;
constexpr long kAddRule = 445;
constexpr long kRestrictSelf = 446;
constexpr unsigned kAskVersion = 1u << 0;
constexpr int kRulePathBeneath = 1;

struct __attribute__((packed)) PathBeneathAttributes {
  std::uint64_t allowed;
  std::int32_t parent;
};

}  // namespace

int abi() {
  const long version = ::syscall(kCreateRuleset, nullptr, 0, kAskVersion);
  return version > 0 ? static_cast<int>(version) : 0;
}

int createRuleset(std::uint64_t handled) {
  // The first field of the attributes; without the later ones, network and scopes are not handled.
  return static_cast<int>(::syscall(kCreateRuleset, &handled, sizeof handled, 0u));
}

int addPath(int ruleset, int descriptor, std::uint64_t allowed) {
  const PathBeneathAttributes attributes{allowed, descriptor};
  return static_cast<int>(::syscall(kAddRule, ruleset, kRulePathBeneath, &attributes, 0u));
}

int restrictSelf(int ruleset) {
  return static_cast<int>(::syscall(kRestrictSelf, ruleset, 0u));
}

}  // namespace veltrad::platform::landlock
