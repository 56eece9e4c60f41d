// The sandbox profile: Landlock and no-new-privileges. Main thread, before any other thread exists: the rules
// bind the calling thread and those that it starts later.
#pragma once

#include <string>
#include <vector>

#include "base/result.h"

namespace veltrad::platform {

class Root;

struct SandboxProfile {
  std::string name;                // "com.florn.veltrad"
  std::vector<std::string> read;   // files or directories, whole trees
  std::vector<std::string> write;  // directories: make, write, rename, remove, and read
};

// The profile "com.florn.veltrad" for this root: see docs/architecture.md.
SandboxProfile veltradSandboxProfile(const Root& root);

// Enters it. Value: one line that says what is in force. A missing path leaves its rule out, rights that the
// kernel does not know are left out. A kernel without Landlock: `inForce` false and the line says so; with
// VELTRA_SANDBOX=required, and when the kernel refuses, an error with the failure text.
struct SandboxState {
  bool inForce;
  std::string line;
};
Result<SandboxState, std::string> enterSandbox(const SandboxProfile& profile);

}  // namespace veltrad::platform
