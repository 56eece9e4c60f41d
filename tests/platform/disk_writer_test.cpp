// SPDX-License-Identifier: Apache-2.0
// The disk writer's thread: order, bounds, and waiting.
#include "platform/disk_writer.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <latch>
#include <string>

#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/scarce_memory.h"
#include "formats/json.h"
#include "platform/child_process.h"
#include "platform/counters.h"
#include "platform/state_file.h"

namespace veltrad::platform {
namespace {

using Put = platform::DiskWriter::Queue::Put;
using Clock = std::chrono::steady_clock;

Clock::time_point soon() {
  return Clock::now() + std::chrono::seconds(10);
}

TEST(DiskWriter, AStalledJobHoldsUpNobodyAndEachQueueHasItsOwnBound) {
  std::latch stalled(1);
  std::string order;
  platform::DiskWriter writer;
  platform::DiskWriter::Queue a(writer, 10), b(writer, 10);
  const auto put = [&](platform::DiskWriter::Queue& queue, char name, std::size_t bytes) {
    return queue.put([&order, name] { order += name; }, bytes);
  };
  EXPECT_EQ(a.put([&] { stalled.wait(); }, 11), Put::taken);  // larger than the bound, but alone
  EXPECT_EQ(put(a, '-', 1), Put::full);
  EXPECT_EQ(put(b, '1', 4), Put::taken);
  EXPECT_EQ(put(b, '2', 6), Put::taken);
  EXPECT_EQ(put(b, '-', 1), Put::full);
  EXPECT_FALSE(writer.drain(Clock::now()));
  stalled.count_down();
  EXPECT_TRUE(writer.drain(soon()));
  EXPECT_EQ(order, "12");

  std::latch begun(1), again(1);
  EXPECT_EQ(a.put([&] { begun.count_down(), again.wait(); }, 1), Put::taken);
  begun.wait();
  for (const char name : {'3', '4', '5'}) put(a, name, 1);
  for (const char name : {'6', '7'}) put(b, name, 1);
  again.count_down();
  EXPECT_TRUE(writer.drain(soon()));
  EXPECT_EQ(order, "1263745");  // in turn
}

TEST(DiskWriter, AThreadThatCannotBeStartedIsStartedByALaterJob) {
  const ChildProcess child([](const auto& say) {
    if (::getuid() == 0 && ::setuid(65534) != 0) return say("no other user");
    rlimit limit{};
    ::getrlimit(RLIMIT_NPROC, &limit);
    const rlimit none{0, limit.rlim_max};
    platform::DiskWriter writer;
    platform::DiskWriter::Queue queue(writer, 10);
    ::setrlimit(RLIMIT_NPROC, &none);
    say(queue.put([&] { say("never"); }, 1) == Put::noThread ? "no thread" : "a thread");
    ::setrlimit(RLIMIT_NPROC, &limit);
    queue.put([&] { say("written"); }, 1);
    writer.drain(soon());
  });
  EXPECT_EQ(child.said, "no thread\nwritten\n");
}

TEST(StateFile, IsWrittenLaterForWantOfMemory) {
  std::uint64_t version = 0;
  FakeFileStore files;
  platform::DiskWriter writer;
  platform::StateFile file({"The state", [&] { return platform::StateFile::Version{version}; },
                            [&] { return std::to_string(version); }},
                           files, writer, "/run/c");
  for (version = 1; version <= 100; ++version) {
    {
      const ScarceMemory scarce(0, false);  // some of the requests need memory
      file.writeSoon();
    }
    EXPECT_TRUE(file.writeSoon());
    EXPECT_TRUE(writer.drain(soon()));
    EXPECT_EQ(files.bytes("/run/c"), std::to_string(version));
  }
}

TEST(StateFile, IsWrittenWhenTheStateChangedAndAgainAfterAFailure) {
  RecordedLog log;
  FakeFileStore files;
  platform::Counters counters;
  platform::DiskWriter writer;
  platform::StateFile file({"The counters", [&] { return platform::StateFile::Version{counters.total()}; },
                            [&] { return counters.json(1'700'000'000.5); }},
                           files, writer, "/run/c");
  const auto written = [&] {
    EXPECT_TRUE(file.writeSoon());
    EXPECT_TRUE(writer.drain(soon()));
    return files.replaced();
  };
  counters.count(wire::Reason::no_storebag, 42);
  counters.count(wire::Reason::event_posted, 0);
  files.failWrites(platform::FileFailure::Kind::noSpace);
  log.expectLine(platform::LogLevel::error,
                 "The counters could not be written: /run/c: No space left on device");
  EXPECT_EQ(written() + written(), 0);
  files.failWrites({});
  EXPECT_EQ(written(), 1);
  EXPECT_EQ(written(), 1);
  EXPECT_EQ(files.mode("/run/c"), 0644u);

  // While the disk is stalled one write waits, and it writes what has been counted until it runs.
  std::latch begun(1), stalled(1);
  platform::DiskWriter::Queue other(writer, 1);
  other.put([&] { begun.count_down(), stalled.wait(), counters.count(wire::Reason::datagram_cut); }, 1);
  begun.wait();
  for (int i = 0; i < 3; ++i) counters.count(wire::Reason::call_unreadable), file.writeSoon();
  EXPECT_FALSE(file.writeLast(Clock::now()));
  stalled.count_down();
  EXPECT_TRUE(file.writeLast(soon()));
  EXPECT_EQ(files.replaced(), 2);
  EXPECT_EQ(files.bytes("/run/c"),
            "{\"counts\":{\"call refused: it cannot be read\":3,\"datagram cut: its text is longer than 1023 "
            "bytes\":1,"
            "\"message dropped: no storebag for a one-shot message\":42},\"pid\":" +
                std::to_string(::getpid()) + ",\"started\":1700000000.5}\n");
}

}  // namespace
}  // namespace veltrad::platform
