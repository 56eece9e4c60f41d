// A piece of a test in a process of its own. Test thread, while no other runs.
#pragma once

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <string_view>

#include "platform/file_descriptor.h"

namespace veltrad::inline fakes {

// The child says what it found on a pipe; `body` is its whole life. A child that is still there is killed.
class ChildProcess {
 public:
  using Say = std::function<void(std::string_view)>;

  explicit ChildProcess(const std::function<int(const Say&)>& body) {
    int ends[2];
    if (::pipe(ends) != 0) return;
    _pid = ::fork();
    if (_pid == 0) {
      ::close(ends[0]);
      ::alarm(60);
      ::_exit(body([&](std::string_view text) {
        const std::string line = std::string(text) + "\n";
        if (::write(ends[1], line.data(), line.size()) < 0) ::_exit(99);
      }));
    }
    ::close(ends[1]);
    _said.reset(ends[0]);
  }
  ~ChildProcess() {
    if (_pid <= 0) return;
    ::kill(_pid, SIGKILL);
    ::waitpid(_pid, nullptr, 0);
  }
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return _pid; }
  void send(int signal) const { ::kill(_pid, signal); }
  // The next line; empty when the child has gone.
  std::string nextLine() const {
    std::string line;
    for (char c = 0; ::read(_said.get(), &c, 1) == 1 && c != '\n';) line += c;
    return line;
  }
  // Everything that is left to say.
  std::string rest() const {
    std::string text;
    for (char c = 0; ::read(_said.get(), &c, 1) == 1;) text += c;
    return text;
  }
  // Waits for the end: the exit status, or minus the signal's number.
  int wait() {
    int status = 0;
    ::waitpid(_pid, &status, 0);
    _pid = 0;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  }

 private:
  pid_t _pid = 0;
  platform::FileDescriptor _said;
};

}  // namespace veltrad::inline fakes
