// SPDX-License-Identifier: Apache-2.0
// The diagnostic message log in a real directory: which files are kept or deleted, and the state after a
// fault.
#include "support/message_log.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <latch>
#include <thread>

#include "fakes/machine.h"
#include "fakes/recorded_log.h"
#include "fakes/temporary_directory.h"
#include "platform/counters.h"
#include "platform/disk_writer.h"

namespace veltrad {
namespace {

using Level = platform::LogLevel;
using ::testing::ElementsAre;

class MessageLogTest : public ::testing::Test {
 protected:
  std::string nameAt(std::int64_t seconds, const char* zeros = "") const {
    return std::string("veltrad_") + zeros + std::to_string(seconds) + "_messageLog.diag";
  }
  std::string dateAt(std::int64_t seconds) const {
    return "(" + support::dateDescription(double(seconds)) + ") ";
  }
  void write(const std::string& text = "text %@ 5%") {
    _messages.writeToLogFile("[%@ -> %@", "b", text);
    EXPECT_TRUE(_writer.drain(std::chrono::steady_clock::now() + std::chrono::seconds(10)));
  }

  const std::int64_t _now = ::time(nullptr);
  const std::string _line = dateAt(_now) + "[b -> text %@ 5%\n";
  RecordedLog _log;
  TemporaryDirectory _place;
  FakeClock _clock{{_now, 900'000}};
  platform::Counters _counters;
  platform::DiskWriter _writer;
  support::MessageLog _messages{_clock, _place.path(), _writer, _counters};
  const std::string _current = _place.path(nameAt(_now));
};

TEST_F(MessageLogTest, KeepsTheYoungestFileOfADay) {
  const std::vector<std::string> foreign{"veltrad_1_other.diag", "veltrad_messageLog.diag",
                                         "veltrad_1_2_messageLog.diag", "xveltrad_1_messageLog.diag"};
  struct File {
    std::int64_t age;        // in seconds, by its name and by its times alike
    const char* zeros = "";  // those with a zero come first in the listing
  };
  const std::pair<std::vector<File>, std::optional<File>> cases[] = {
      {{}, {}},
      {{{86'395}}, File{86'395}},
      {{{86'405}}, {}},
      {{{72'000}, {36'000}}, File{36'000}},
      {{{72'000}, {36'000, "0"}}, File{36'000, "0"}},
      {{{5, "0"}, {5}}, File{5, "0"}},
      {{{90'000}, {9, "0"}, {100'000, "0"}, {10}, {80'000}}, File{9, "0"}}};
  for (const auto& [files, kept] : cases) {
    for (const std::string& name : _place.names()) std::filesystem::remove(_place.path(name));
    for (const std::string& name : foreign) _place.write(name, "foreign");
    for (const File& file : files) {
      const std::string name = nameAt(_now - file.age, file.zeros);
      _place.write(name, "old\n");
      const timespec times[] = {{_now - file.age, 900'000'000}, {_now - file.age, 900'000'000}};
      ASSERT_EQ(::utimensat(AT_FDCWD, _place.path(name).c_str(), times, 0), 0);
    }
    write();
    std::vector<std::string> expected = foreign;
    expected.push_back(kept ? nameAt(_now - kept->age, kept->zeros) : nameAt(_now));
    EXPECT_THAT(_place.names(), ::testing::UnorderedElementsAreArray(expected));
    EXPECT_EQ(_place.read(expected.back()), (kept ? "old\n" : "") + _line);
    const auto mode = std::filesystem::status(_place.path(expected.back())).permissions();
    if (!kept) EXPECT_EQ(mode & std::filesystem::perms(0027), std::filesystem::perms::none);
  }
}

TEST_F(MessageLogTest, WhatCannotBeWrittenIsDeletedAndTheNextMessageBeginsAnew) {
  _place.write("elsewhere", "foreign");
  rlimit before{};
  ::getrlimit(RLIMIT_FSIZE, &before);
  const auto handler = ::signal(SIGXFSZ, SIG_IGN);
  std::uint64_t lost = 0;
  const std::function<void()> inItsPlace[] = {
      [&] { std::filesystem::create_symlink("elsewhere", _current); },
      [&] { ASSERT_EQ(::mkfifo(_current.c_str(), 0600), 0); },
      [&] { std::filesystem::create_directory(_current); },
      [&] {
        std::ofstream(_current) << std::string(4'090, 'x');
        const rlimit full{4'096, before.rlim_max};  // room for a piece of the line
        ::setrlimit(RLIMIT_FSIZE, &full);
      }};
  for (const auto& put : inItsPlace) {
    put();
    write("lost");
    EXPECT_EQ(_counters.value(wire::Reason::log_line_disk), ++lost);
    ::setrlimit(RLIMIT_FSIZE, &before);
    ASSERT_THAT(_place.names(), ElementsAre("elsewhere"));
    _log.expectLine(Level::info, "writeToLogFile: Deleted expired veltrad log file " + _current + " (20");
    write();
    EXPECT_EQ(_place.read(nameAt(_now)), _line);
    std::filesystem::remove(_current);
  }
  ::signal(SIGXFSZ, handler);
  EXPECT_EQ(_place.read("elsewhere"), "foreign");
}

TEST_F(MessageLogTest, LinesThatWaitAreWrittenTogetherInTheirOrder) {
  for (const auto& [seconds, text] : {std::pair{1416168834, "2014-11-16 20:13:54 +0000"},
                                      {951782400, "2000-02-29 00:00:00 +0000"},
                                      {1735689599, "2024-12-31 23:59:59 +0000"}}) {
    EXPECT_EQ(support::dateDescription(seconds + 0.9), text);
  }
  platform::DiskWriter::Queue other(_writer, 1);
  std::latch begun(1), stalled(1);
  other.put([&] { begun.count_down(), stalled.wait(); }, 1);
  begun.wait();
  std::string expected;
  for (int i = 0; i < 150; ++i) {
    _messages.writeToLogFile("%@", std::to_string(i));
    expected += dateAt(_now) + std::to_string(i) + "\n";
  }
  stalled.count_down();
  write();
  EXPECT_EQ(_place.read(nameAt(_now)), expected + _line);
}

TEST_F(MessageLogTest, NobodyWaitsForADiskThatDoesNotAnswer) {
  platform::DiskWriter::Queue other(_writer, 1);
  std::latch begun(1), stalled(1);
  other.put([&] { begun.count_down(), stalled.wait(); }, 1);
  begun.wait();
  const std::string megabyte(1 << 20, 'x');
  for (int i = 0; i < 6; ++i) _messages.writeToLogFile("%@", megabyte);
  EXPECT_EQ(_counters.value(wire::Reason::log_line_queue_full), 3u);
  const std::string stamp = dateAt(_now);
  _clock.advance(60);  // a line has the time at which it was logged
  stalled.count_down();
  write("after");
  const std::string text = _place.read(_place.names().at(0));
  EXPECT_EQ(text.substr(0, stamp.size() + 1), stamp + "x");
  EXPECT_EQ(text.size(), 3 * (stamp.size() + megabyte.size() + 1) + (dateAt(0) + "[b -> after\n").size());
}

}  // namespace
}  // namespace veltrad
