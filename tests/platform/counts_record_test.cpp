// SPDX-License-Identifier: Apache-2.0
// What the next process counts for one that was killed.
#include "platform/counts_record.h"

#include <gtest/gtest.h>

#include <optional>
#include <tuple>

#include "fakes/temporary_directory.h"
#include "platform/file_store.h"

namespace veltrad::platform {
namespace {

using wire::Reason;

// A process that counts, and is killed by its destructor.
struct Life {
  explicit Life(const TemporaryDirectory& directory)
      : path(directory.path("counters.json")),
        record(CountsRecord::open(directory.path("counts"), files, path, kStarted)) {
    EXPECT_TRUE(record.ok()) << record.error();
    counters.countIn(record.value().counts());
  }
  void writeCounters() { EXPECT_TRUE(files.replace(path, counters.json(kStarted), 0644)); }
  std::uint64_t lostBefore() const { return counters.value(Reason::daemon_ended); }

  static constexpr double kStarted = 1'764'103'942.123456;
  DiskFileStore files;
  const std::string path;
  Result<CountsRecord, std::string> record;
  Counters counters;
};

TEST(CountsRecord, WhatAKilledProcessHadNotSettledOrToldIsCountedOnce) {
  const TemporaryDirectory directory;
  directory.write("counts", std::string(4096, 'x'));  // of nobody
  {
    Life life(directory);
    EXPECT_EQ(life.lostBefore(), 0u);
    EXPECT_EQ(life.record.value().counts().day.events, 0u);
    life.record.value().counts().day = {20'000, 7, 70};
    for (int i = 0; i < 10; ++i) life.counters.eventTaken();
    life.counters.count(Reason::event_batched, 10);
    life.counters.count(Reason::post_failed);
    life.counters.count(Reason::client_gone, 2);
    life.writeCounters();
    life.counters.count(Reason::event_posted, 3);
    life.counters.count(Reason::post_failed, 2);
    life.counters.count(Reason::backend_disabled, 4);
    life.counters.count(Reason::no_backends);
    life.counters.count(Reason::never_acknowledged);
  }
  // Four events were neither posted nor lost, and of losses 2 + 4 + 1 were not in the file.
  EXPECT_EQ(Life(directory).lostBefore(), 11u);
  {
    Life life(directory);  // the one before had told nobody
    const DayAccount& day = life.record.value().counts().day;
    EXPECT_EQ(std::tuple(day.day, day.events, day.bytes), std::tuple(20'000, 7u, 70u));
    EXPECT_EQ(life.lostBefore(), 11u);
    life.counters.eventTaken();
    life.writeCounters();
  }
  EXPECT_EQ(Life(directory).lostBefore(), 1u);
  {
    Life life(directory);
    life.counters.count(Reason::no_backends, 5);
    life.counters.eventTaken();
    life.record.value().told();
  }
  EXPECT_EQ(Life(directory).lostBefore(), 1u);
}

}  // namespace
}  // namespace veltrad::platform
