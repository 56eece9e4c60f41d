// SPDX-License-Identifier: Apache-2.0
// A piece of a test in a process of its own. Test thread, while no other runs.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"

namespace veltrad {

// The child says what it found, a line at a time; `body` is its whole life.
class ChildProcess {
 public:
  using Say = std::function<void(std::string_view)>;

  explicit ChildProcess(const std::function<void(const Say&)>& body) {
    int ends[2];
    if (::pipe(ends) != 0) return;
    pid = ::fork();
    if (pid == 0) {
      ::alarm(60);
      const int out = ::fcntl(ends[1], F_DUPFD, 100);  // leaves the low numbers to the body
      ::close(ends[0]);
      ::close(ends[1]);
      body([&](std::string_view text) {
        const std::string line = std::string(text) + "\n";
        if (::write(out, line.data(), line.size()) < 0) ::_exit(99);
      });
      ::_exit(0);
    }
    ::close(ends[1]);
    const FileDescriptor in(ends[0]);
    for (char c = 0; ::read(in.get(), &c, 1) == 1;) said += c;
    int status = 0;
    ::waitpid(pid, &status, 0);
    EXPECT_EQ(status, 0) << "the child ended badly";
  }

  pid_t pid = 0;  // of the child, which has ended
  std::string said;
};

}  // namespace veltrad
