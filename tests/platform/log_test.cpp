// The log's lines on a real standard error.
#include "platform/log.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>

#include <thread>
#include <vector>

#include "platform/file_descriptor.h"

namespace veltrad::platform {
namespace {

using ::testing::MatchesRegex;

// Standard error replaced by one end of a pipe or terminal.
class LogTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const char* variable : {"VELTRA_LOG", "VELTRA_LOG_TARGET", "JOURNAL_STREAM"}) ::unsetenv(variable);
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    _reader.reset(ends[0]);
    replaceStandardError(ends[1]);
  }
  void TearDown() override {
    VeltraLogging::stopLogging();
    log::threshold = static_cast<int>(LogLevel::info);
    restoreStandardError();
    for (const char* variable : {"VELTRA_LOG", "VELTRA_LOG_TARGET", "JOURNAL_STREAM"}) ::unsetenv(variable);
  }
  void replaceStandardError(int descriptor) {
    if (!_saved.isOpen()) _saved.reset(::fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 10));
    ::dup2(descriptor, STDERR_FILENO);
    ::close(descriptor);
  }
  void restoreStandardError() { ::dup2(_saved.get(), STDERR_FILENO); }
  // What one read finds; empty when nothing was written.
  std::string written() const {
    pollfd descriptor{_reader.get(), POLLIN, 0};
    if (::poll(&descriptor, 1, 0) != 1) return "";
    char buffer[8'192];
    const ssize_t got = ::read(_reader.get(), buffer, sizeof buffer);
    return got > 0 ? std::string(buffer, static_cast<std::size_t>(got)) : "";
  }

  FileDescriptor _reader;
  FileDescriptor _saved;
};

TEST_F(LogTest, WritesOneLineWithItsLevelInFront) {
  VeltraLogging::startLogging("veltrad", "Daemon");
  EXPECT_EQ(written(), "");
  logError("main: %s %u", "failed", 7u);
  EXPECT_EQ(written(), "<3>main: failed 7\n");
  logWarning("w\n");  // a line break at the end is dropped, one alone
  EXPECT_EQ(written(), "<4>w\n");
  logInfo("%s", std::string(5'000, 'x').c_str());
  EXPECT_EQ(written(), "<6>" + std::string(5'000, 'x') + "\n");
}

TEST_F(LogTest, WhatComesFromOutsideCannotForgeALine) {
  VeltraLogging::startLogging("veltrad", "Daemon");
  logInfo("name \"%s\"", "a\n<3>forged\x1b[2J\\ \xc3\xa9 \xe2\x80\xa8 \xff");
  EXPECT_EQ(written(), "<6>name \"a\\x0A<3>forged\\x1B[2J\\\\ \xc3\xa9 \\xE2\\x80\\xA8 \\xFF\"\n");
}

TEST_F(LogTest, BelowTheThresholdNothingIsEvaluated) {
  int evaluated = 0;
  const auto argument = [&] { return ++evaluated; };
  const std::pair<const char*, int> cases[] = {{"error", 1}, {"warning", 2}, {"info", 3}, {"debug", 4}};
  for (const auto& [name, lines] : cases) {
    ::setenv("VELTRA_LOG", name, 1);
    VeltraLogging::startLogging("veltrad", "Daemon");
    evaluated = 0;
    logError("%d", argument());
    logWarning("%d", argument());
    logInfo("%d", argument());
    logDebug("%d", argument());
    EXPECT_EQ(evaluated, lines) << name;
    const std::string text = written();
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), lines) << name;
  }
}

TEST_F(LogTest, AnUnknownChoiceIsOneWarningThatNamesTheChoices) {
  ::setenv("VELTRA_LOG", "loud", 1);
  VeltraLogging::startLogging("veltrad", "Daemon");
  EXPECT_EQ(written(), "<4>VELTRA_LOG is \"loud\": expected error, warning, info or debug; using info\n");
  ::unsetenv("VELTRA_LOG");
  ::setenv("VELTRA_LOG_TARGET", "paper", 1);
  VeltraLogging::startLogging("veltrad", "Daemon");
  EXPECT_EQ(written(), "<4>VELTRA_LOG_TARGET is \"paper\": expected auto, stderr or syslog; using auto\n");
}

TEST_F(LogTest, TheJournalTakesOverOnlyWhereItIsStandardError) {
  struct stat status {};
  ASSERT_EQ(::fstat(STDERR_FILENO, &status), 0);
  const std::string device = std::to_string(status.st_dev);
  ::setenv("JOURNAL_STREAM", (device + ":" + std::to_string(status.st_ino + 1)).c_str(), 1);
  VeltraLogging::startLogging("veltrad", "Daemon");
  logInfo("here");
  EXPECT_EQ(written(), "<6>here\n");
  ::setenv("JOURNAL_STREAM", (device + ":" + std::to_string(status.st_ino)).c_str(), 1);
  VeltraLogging::startLogging("veltrad_test", "Daemon");
  logDebug("below the threshold");
  logInfo("to the journal, where there is one");
  EXPECT_EQ(written(), "");
  ::setenv("VELTRA_LOG_TARGET", "stderr", 1);
  VeltraLogging::startLogging("veltrad", "Daemon");
  logInfo("here again");
  EXPECT_EQ(written(), "<6>here again\n");
}

TEST_F(LogTest, ATerminalShowsTheTimeAndTheLevelsName) {
  const int terminal = ::posix_openpt(O_RDWR | O_NOCTTY);
  ASSERT_GE(terminal, 0);
  ASSERT_EQ(::grantpt(terminal), 0);
  ASSERT_EQ(::unlockpt(terminal), 0);
  _reader.reset(terminal);
  replaceStandardError(::open(::ptsname(terminal), O_RDWR | O_NOCTTY));
  VeltraLogging::startLogging("veltrad", "Daemon");
  logWarning("slow");
  EXPECT_THAT(written(),
              MatchesRegex("[0-2][0-9]:[0-5][0-9]:[0-6][0-9]\\.[0-9][0-9][0-9] warning: slow\r\n"));
}

TEST_F(LogTest, LinesOfManyThreadsDoNotMix) {
  VeltraLogging::startLogging("veltrad", "Daemon");
  std::vector<std::thread> threads;
  for (char c = 'a'; c < 'e'; ++c) {
    threads.emplace_back([c] {
      for (int i = 0; i < 10; ++i) logInfo("%s", std::string(40, c).c_str());
    });
  }
  for (auto& thread : threads) thread.join();
  std::string text = written();
  int lines = 0;
  for (; !text.empty(); ++lines) {
    ASSERT_EQ(text.find('\n'), 43u);
    EXPECT_EQ(text.substr(3, 40), std::string(40, text[3]));
    text.erase(0, 44);
  }
  EXPECT_EQ(lines, 40);
}

}  // namespace
}  // namespace veltrad::platform
