// SPDX-License-Identifier: Apache-2.0
// The sandbox: Landlock and no-new-privileges. To be entered on the main thread before any other thread
// exists, because the rules apply only to the calling thread and those that it starts later.
#pragma once

#include <string>
#include <vector>

#include "base/result.h"

namespace veltrad::platform {

class Root;

struct SandboxProfile {
  std::string name;
  // Files, or directories with all that is below.
  std::vector<std::string> read;
  // Directories in which files may also be made, written, renamed and removed.
  std::vector<std::string> write;
};

// The profile "com.florn.veltrad": see docs/architecture.md.
SandboxProfile veltradSandboxProfile(const Root& root);

struct SandboxState {
  bool inForce;
  // A log line that describes the sandbox in force.
  std::string line;
};
// Enters the sandbox. Missing paths, and rights that the kernel does not know, are left out. Without Landlock
// in the kernel, `inForce` is false, or with VELTRA_SANDBOX=required this is an error. The error is a failure
// text.
Result<SandboxState, std::string> enterSandbox(const SandboxProfile& profile);

}  // namespace veltrad::platform
