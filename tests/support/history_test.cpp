// SPDX-License-Identifier: Apache-2.0
// The history on a real disk: intact after kills and within its bounds, with a record for every departure.
#include "support/history.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <random>

#include "fakes/machine.h"
#include "fakes/recorded_log.h"
#include "fakes/scarce_memory.h"
#include "fakes/temporary_directory.h"
#include "support/history_file.h"

namespace veltrad {
namespace {

using namespace std::chrono_literals;
using support::HistoryFile;
using support::HistoryFolder;

class HistoryTest : public ::testing::Test {
 protected:
  std::string path(std::int64_t day) const { return HistoryFolder::pathOf(_history->directory(), day); }
  std::int64_t today() const { return _clock.now().seconds / 86'400; }
  bool write() { return _history->writeNow(std::chrono::steady_clock::now() + 20s); }
  std::uint64_t add(const std::string& body) {
    return _history->begins({{"n", ++_count}}, {body, nullptr, 0});
  }
  // The numbers and bodies of the records in a day's file.
  std::vector<std::pair<int, std::string>> records(std::int64_t day) const {
    std::vector<std::pair<int, std::string>> found;
    const HistoryFile file(path(day));
    for (auto place = file.at(0); place; place = file.at(place->end())) {
      EXPECT_TRUE(file.isIntact(*place));
      const auto header = file.header(*place);
      found.emplace_back(header ? header->int32("n").value_or(0) : -1, file.body(*place, 0, 1u << 20));
    }
    return found;
  }
  void restart() {
    _history.emplace(_clock, _directory.path() + "/history", _writer);
    _history->keep(_space);
    _history->mend();
  }
  void SetUp() override { restart(); }

  TemporaryDirectory _directory;
  FakeClock _clock;
  platform::DiskWriter _writer;
  support::HistorySpace _space{7, 1u << 20};
  std::optional<support::History> _history;
  int _count = 0;
};

TEST_F(HistoryTest, CutsOffWhatAKillLeftUnfinishedAndGoesOn) {
  add("first");
  _history->ended(add(std::string(3000, 'x')), {{"n", 3}});
  ASSERT_TRUE(write());
  const auto whole = records(today());
  ASSERT_EQ(whole.size(), 3u);
  EXPECT_EQ(std::filesystem::status(path(today())).permissions(), std::filesystem::perms(0600));
  const auto size = std::filesystem::file_size(path(today()));
  RecordedLog log;
  for (const std::size_t torn : {1u, 4u, 30u, 300u}) {
    std::filesystem::resize_file(path(today()), size);
    std::ofstream(path(today()), std::ios::app) << std::string(torn, '\0');
    log.expectLine(RecordedLog::Level::warning, std::to_string(torn) + " bytes of an unfinished record");
    restart();
    ASSERT_TRUE(write());
    EXPECT_EQ(records(today()), whole) << torn;
  }
  const std::uintmax_t lost = 20;
  std::filesystem::resize_file(path(today()), size - lost);
  log.expectLine(RecordedLog::Level::warning, "of an unfinished record");
  restart();
  add("next");
  ASSERT_TRUE(write());
  const auto now = records(today());
  ASSERT_EQ(now.size(), 3u);
  EXPECT_EQ(now[1], whole[1]);
  EXPECT_EQ(now[2].second, "next");
}

TEST_F(HistoryTest, KeepsTheNewestWithinItsBytesAndDays) {
  _space = {2, 65'536};
  restart();
  for (int day = 0; day < 3; ++day) {
    for (int writes = 0; writes < 6; ++writes) {
      for (int i = 0; i < 4; ++i) add(std::string(4000, static_cast<char>('a' + i)));
      ASSERT_TRUE(write());
      const auto days = HistoryFolder::days(_history->directory());
      std::uint64_t bytes = 0;
      for (const auto& [name, size] : days) bytes += size;
      EXPECT_LE(bytes, _space.bytes);
      EXPECT_GE(bytes, _count < 16 ? 0 : _space.bytes * 3 / 4);
      EXPECT_LE(days.size(), 2u);
      EXPECT_EQ(records(today()).back().first, _count);
    }
    _clock.advance(86'400);
  }
  const auto removed = _history->purge(std::chrono::steady_clock::now() + 20s);
  ASSERT_TRUE(removed);
  EXPECT_GT(removed->records, 10u);
  EXPECT_TRUE(HistoryFolder::days(_history->directory()).empty());
}

TEST_F(HistoryTest, LosesNothingForWantOfMemory) {
  platform::DiskWriter::Queue another(_writer, 1);
  const auto onWriter = [&](const std::function<void()>& job) {
    another.put(job, 1);
    _writer.drain(std::chrono::steady_clock::now() + 20s);
  };
  const auto began = std::chrono::steady_clock::now();
  for (const bool once : {true, false}) {
    bool failed = true;
    for (std::size_t granted = 0; failed; ++granted) {
      _space.bytes = 65'536;
      restart();
      onWriter([] {});                // the files are mended
      add(std::string(17'000, 'x'));  // of which the digest is kept
      add("small");
      std::optional<ScarceMemory> scarce;
      onWriter([&] { scarce.emplace(granted, once); });
      write();
      onWriter([&] {
        failed = scarce->hasFailed();
        scarce.reset();
      });
      add("next");
      ASSERT_TRUE(write());
      const auto all = records(today());
      ASSERT_GE(all.size(), 3u);
      for (std::size_t back = 0; back < 3; ++back)
        ASSERT_EQ(all[all.size() - 1 - back].first, _count - static_cast<int>(back)) << granted;
      EXPECT_TRUE(_history->hasRoom());
    }
  }
  EXPECT_LT(std::chrono::steady_clock::now() - began, 20s) << "whoever waits for the writer hears from it";
}

TEST_F(HistoryTest, ALargeBodyIsKeptAsItsDigest) {
  _space.bytes = 65'536;
  restart();
  add(std::string(16'384, 'x'));
  add(std::string(16'385, 'x'));
  ASSERT_TRUE(write());
  const HistoryFile file(path(today()));
  const auto first = file.at(0);
  const auto header = file.header(*file.at(first->end()));
  EXPECT_EQ(first->bodyBytes, 16'384u);
  EXPECT_EQ(header->boolean("kept"), false);
  EXPECT_EQ(*header->string("sha256"), "39061532d423f2d385027b9d40fc07e2bedf7bf3151e8f8bdd5ff005cd5136d1");
}

TEST_F(HistoryTest, WhatTheDiskDoesNotTakeWaitsAndLeavesNoRoom) {
  RecordedLog log;
  log.expectLine(RecordedLog::Level::error, "could not be written, and nothing more leaves");
  _space.bytes = 16u << 20;
  restart();
  _directory.write("history", "in the way");
  while (_history->hasRoom()) add(std::string(1u << 20, 'x'));
  EXPECT_EQ(_count, 4);
  ASSERT_TRUE(write());
  EXPECT_FALSE(_history->hasRoom());
  std::filesystem::remove(_history->directory());
  ASSERT_TRUE(write());
  EXPECT_TRUE(_history->hasRoom());
  EXPECT_EQ(records(today()).size(), 4u);
}

// Of any length up to more than is written in one call.
std::string bodyOf(int number) {
  return std::string(std::size_t(number) * 7919 % 600'000, static_cast<char>('a' + number % 26));
}

// Writes three records at a time, and says the number of the last one that is on disk.
[[noreturn]] void writeUntilKilled(const std::string& directory, std::int64_t bytes, int number, int to) {
  FakeClock clock;
  platform::DiskWriter writer;
  support::History history(clock, directory, writer);
  history.keep(support::HistorySpace{7, static_cast<std::uint64_t>(bytes)});
  history.mend();
  for (;;) {
    for (int i = 0; i < 3; ++i, ++number) history.begins({{"n", number}}, {bodyOf(number), nullptr, 0});
    const int last = number - 1;
    const bool written = history.writeNow(std::chrono::steady_clock::now() + 20s);
    if (!written || ::write(to, &last, sizeof last) != sizeof last) ::_exit(1);
  }
}

// VELTRA_ROUNDS says how often it is killed (8).
TEST(HistoryKilled, LosesNothingThatWasSyncedAndShowsNothingTorn) {
  constexpr std::int64_t kBytes = 8 << 20;
  const char* given = std::getenv("VELTRA_ROUNDS");
  const TemporaryDirectory directory;
  const std::string path = HistoryFolder::pathOf(directory.path(), FakeClock().now().seconds / 86'400);
  std::mt19937 dice(std::random_device{}());
  int last = 0;
  std::uint64_t cut = 0;
  for (int round = given ? std::atoi(given) : 8; round > 0; --round) {
    int ends[2];
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const FileDescriptor said(ends[0]);
    const pid_t child = ::fork();
    if (child == 0) {
      ::alarm(60);
      writeUntilKilled(directory.path(), kBytes, last + 1, ends[1]);
    }
    ::close(ends[1]);
    int synced = last;
    const auto hears = [&] { return ::read(said.get(), &synced, sizeof synced) == sizeof synced; };
    for (unsigned writes = 1 + dice() % 3; writes > 0; --writes) ASSERT_TRUE(hears());
    ::usleep(dice() % 10'000);  // at any moment of a write
    ::kill(child, SIGKILL);
    ::waitpid(child, nullptr, 0);
    while (hears()) {
    }
    cut += HistoryFolder(directory.path()).mend();
    const HistoryFile file(path);
    int next = 0;
    for (auto place = file.at(0); place; place = file.at(place->end())) {
      ASSERT_TRUE(file.isIntact(*place));
      const int number = file.header(*place)->int32("n").value_or(-1);
      ASSERT_TRUE(next == 0 || number == next) << number;
      ASSERT_EQ(file.body(*place, 0, 1u << 20), bodyOf(number)) << number;
      next = number + 1;
    }
    last = next - 1;
    ASSERT_GE(last, synced);
    ASSERT_LE(file.size(), std::uint64_t(kBytes) + 3 * 600'100);
  }
  std::printf("%d records, %llu bytes of unfinished ones cut off\n", last,
              static_cast<unsigned long long>(cut));
}

}  // namespace
}  // namespace veltrad
