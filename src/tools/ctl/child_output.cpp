// SPDX-License-Identifier: Apache-2.0
// Runs one child process with one pipe.
#include "tools/ctl/child_output.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "base/file_descriptor.h"

namespace veltrad::ctl {

namespace {

// False: not all that there is.
bool readAll(int from, std::chrono::steady_clock::time_point deadline, std::size_t most, std::string& out) {
  for (;;) {
    const auto left =
        std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now()).count();
    pollfd watched{from, POLLIN, 0};
    if (left <= 0 || out.size() > most) return false;
    if (::poll(&watched, 1, static_cast<int>(left)) <= 0) continue;  // the clock decides
    char bytes[4096];
    const ssize_t count = ::read(from, bytes, sizeof bytes);
    if (count == 0) return true;
    if (count < 0 && errno != EINTR) return false;
    if (count > 0) out.append(bytes, static_cast<std::size_t>(count));
  }
}

}  // namespace

std::optional<std::string> outputOf(const std::vector<std::string>& command, std::chrono::seconds patience,
                                    std::size_t most) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return std::nullopt;
  FileDescriptor reading(ends[0]), writing(ends[1]);
  std::vector<char*> arguments;
  arguments.reserve(command.size() + 1);
  for (const std::string& argument : command) arguments.push_back(const_cast<char*>(argument.c_str()));
  arguments.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  if (::posix_spawn_file_actions_init(&actions) != 0) return std::nullopt;
  ::posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
  ::posix_spawn_file_actions_adddup2(&actions, writing.get(), STDOUT_FILENO);
  ::posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  pid_t child = 0;
  const int error = ::posix_spawnp(&child, arguments[0], &actions, nullptr, arguments.data(), environ);
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) return std::nullopt;
  writing.reset();
  std::string out;
  const bool whole = readAll(reading.get(), std::chrono::steady_clock::now() + patience, most, out);
  if (!whole) ::kill(child, SIGKILL);
  int status = 0;
  while (::waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  if (!whole || !WIFEXITED(status) || WEXITSTATUS(status) != 0) return std::nullopt;
  return out;
}

}  // namespace veltrad::ctl
