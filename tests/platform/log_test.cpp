// SPDX-License-Identifier: Apache-2.0
// The log's lines on a real standard error.
#include "platform/log.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <limits.h>
#include <poll.h>
#include <stdlib.h>
#include <unistd.h>

#include "base/file_descriptor.h"

namespace veltrad::platform {
namespace {

// Standard error replaced by one end of a pipe.
class LogTest : public ::testing::Test {
 protected:
  static void forgetEnvironment() {
    for (const char* variable : {"VELTRA_LOG", "VELTRA_LOG_TARGET", "JOURNAL_STREAM"}) ::unsetenv(variable);
  }
  static void start() {
    ::setenv("VELTRA_LOG", "info", 1);
    platform::VeltraLogging::startLogging("veltrad", "Daemon");
  }
  void SetUp() override {
    forgetEnvironment();
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    _reader.reset(ends[0]);
    ::dup2(ends[1], STDERR_FILENO);
    ::close(ends[1]);
  }
  void TearDown() override {
    platform::VeltraLogging::stopLogging();
    log::threshold = static_cast<int>(platform::LogLevel::info);
    ::dup2(_saved.get(), STDERR_FILENO);
    forgetEnvironment();
  }
  // What one read finds; empty when nothing was written.
  std::string written() const {
    pollfd descriptor{_reader.get(), POLLIN, 0};
    if (::poll(&descriptor, 1, 0) != 1) return "";
    char buffer[8'192];
    const ssize_t got = ::read(_reader.get(), buffer, sizeof buffer);
    return got > 0 ? std::string(buffer, static_cast<std::size_t>(got)) : "";
  }

  FileDescriptor _reader;
  const FileDescriptor _saved{::fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 10)};
};

TEST_F(LogTest, WritesOneLineWithItsLevelInFrontThatNobodyElseCanForge) {
  start();
  EXPECT_EQ(written(), "");
  logError("main: %s %u", "failed", 7u);
  EXPECT_EQ(written(), "<3>main: failed 7\n");
  logWarning("w\n");  // a line break at the end is dropped, one alone
  EXPECT_EQ(written(), "<4>w\n");
  // One write at most, whatever its length: a pipe never tears it.
  for (const std::size_t length : {4'092u, 4'093u, 70'000u}) {
    logInfo("%s", std::string(length, 'x').c_str());
    const std::string line = written();
    const std::size_t kept = line.find_first_not_of('x', 3) - 3;
    const std::string note = "… (" + std::to_string(length - kept) + " bytes cut)";
    EXPECT_EQ(line, "<6>" + std::string(kept, 'x') + (length > 4'092 ? note : "") + "\n");
    EXPECT_LE(line.size(), std::size_t{PIPE_BUF});
    EXPECT_GE(line.size(), std::size_t{PIPE_BUF} - 40);
  }
  logInfo("name \"%s\"", "a\n<3>forged\x1b[2J\\ \xc3\xa9 \xe2\x80\xa8 \xff");
  EXPECT_EQ(written(), "<6>name \"a\\x0A<3>forged\\x1B[2J\\\\ \xc3\xa9 \\xE2\\x80\\xA8 \\xFF\"\n");
}

}  // namespace
}  // namespace veltrad::platform
