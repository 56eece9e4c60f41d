// SPDX-License-Identifier: Apache-2.0
// The kernel's Landlock interface (landlock(7)), by number, because the system's headers may be older than
// the kernel.
#pragma once

#include <cstdint>

namespace veltrad::platform::landlock {

inline constexpr std::uint64_t kExecute = 1u << 0;
inline constexpr std::uint64_t kWriteFile = 1u << 1;
inline constexpr std::uint64_t kReadFile = 1u << 2;
inline constexpr std::uint64_t kReadDirectory = 1u << 3;
inline constexpr std::uint64_t kRemoveDirectory = 1u << 4;
inline constexpr std::uint64_t kRemoveFile = 1u << 5;
inline constexpr std::uint64_t kMakeDirectory = 1u << 7;
inline constexpr std::uint64_t kMakeRegularFile = 1u << 8;
inline constexpr std::uint64_t kMakeSocket = 1u << 9;
inline constexpr std::uint64_t kMakeSymbolicLink = 1u << 12;
inline constexpr std::uint64_t kRefer = 1u << 13;
inline constexpr std::uint64_t kTruncate = 1u << 14;
inline constexpr std::uint64_t kDeviceIOControl = 1u << 15;

// All rights over files that a kernel of this ABI knows, up to the last one listed above.
constexpr std::uint64_t rightsOfABI(int abi) {
  std::uint64_t rights = (kMakeSymbolicLink << 1) - 1;
  if (abi >= 2) rights |= kRefer;
  if (abi >= 3) rights |= kTruncate;
  if (abi >= 5) rights |= kDeviceIOControl;
  return rights;
}

// The rights that a rule on a file may hold; the kernel refuses a rule with any other.
inline constexpr std::uint64_t kRightsOfFiles =
    kExecute | kWriteFile | kReadFile | kTruncate | kDeviceIOControl;

// The ABI, from 1; 0 if the kernel has no Landlock or it is switched off.
int abi();
// A close-on-exec descriptor, or -1 with errno. The rights `handled` are refused unless a rule allows them.
int createRuleset(std::uint64_t handled);
// 0, or -1 with errno. `descriptor` names the file or directory (O_PATH).
int addPath(int ruleset, int descriptor, std::uint64_t allowed);
int restrictSelf(int ruleset);

}  // namespace veltrad::platform::landlock
