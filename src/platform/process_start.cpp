// SPDX-License-Identifier: Apache-2.0
// Standard descriptors, the environment, and the guard against exit().
#include "platform/process_start.h"

#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

#include "platform/log.h"

namespace veltrad::platform {

namespace {

std::atomic<bool> exitForbidden{false};

extern "C" void refuseExit() {
  if (!exitForbidden.load()) return;
  logError("main: code in the process has called exit, which only an ordered stop may; status 1");
  ::_exit(1);
}

}  // namespace

void openStandardDescriptors() {
  for (int descriptor = STDIN_FILENO; descriptor <= STDERR_FILENO; ++descriptor) {
    if (::fcntl(descriptor, F_GETFD) >= 0 || errno != EBADF) continue;
    // It gets this number, the lowest free one: those below are open.
    if (::open("/dev/null", descriptor == STDIN_FILENO ? O_RDONLY : O_WRONLY) != descriptor) std::abort();
  }
}

void keepEnvironment(std::initializer_list<std::string_view> names) {
  std::vector<std::pair<std::string, std::string>> kept;
  for (const std::string_view name : names) {
    const std::string text(name);
    if (const char* value = std::getenv(text.c_str())) kept.emplace_back(text, value);
  }
  ::clearenv();
  for (const auto& [name, value] : kept) ::setenv(name.c_str(), value.c_str(), 1);
}

void forbidExit() {
  exitForbidden = true;
  renewExitGuard();
}

// Handlers run in reverse order of their registration.
void renewExitGuard() {
  if (!exitForbidden.load()) return;
  std::atexit(refuseExit);
  std::at_quick_exit(refuseExit);
}

void allowExit() {
  exitForbidden = false;
}

}  // namespace veltrad::platform
