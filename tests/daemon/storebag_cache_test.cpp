// SPDX-License-Identifier: Apache-2.0
// The storebag cache: what it downloads and when, and its state after a failure.
#include "daemon/storebag_cache.h"

#include <gtest/gtest.h>

#include <condition_variable>
#include <mutex>
#include <new>
#include <thread>
#include <utility>
#include <vector>

#include "config/storebag_content.h"
#include "config/storebag_source.h"
#include "daemon/lock_ranks.h"
#include "fakes/machine.h"
#include "fakes/recorded_log.h"

namespace veltrad {
namespace {

// Answers as the test says; may be told to hold an exchange until it is let go.
struct Source final : config::StorebagSource {
  config::StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t, const std::optional<std::string>& lastModified) override {
    using Kind = config::StorebagAnswer::Kind;
    std::unique_lock held(mutex);
    ++fetches;
    changed.notify_all();
    changed.wait(held, [this] { return !hold; });
    if (std::exchange(lacksMemory, false)) throw std::bad_alloc();
    conditional = lastModified;
    const Kind kind = section ? Kind::fetched : answersNotModified ? Kind::notModified : Kind::failed;
    config::StorebagSectionAnswer answer;
    answer.kind = kind;
    answer.attempted = attempts;
    answer.maxAge = age;
    answer.lastModified = newLastModified.empty() ? lastModified : newLastModified;
    answer.section = section;
    answer.version = "v" + std::to_string(fetches);
    return answer;
  }
  double jitter() override { return share; }
  std::optional<std::string> whyNotUsed(const config::StorebagSection&) override {
    return expired ? std::optional<std::string>("expired on Monday") : std::nullopt;
  }
  void waitForFetches(int count) {
    std::unique_lock held(mutex);
    ASSERT_TRUE(changed.wait_for(held, std::chrono::seconds(10), [&] { return fetches >= count; }));
  }
  void letGo() {
    const std::lock_guard held(mutex);
    hold = false;
    changed.notify_all();
  }

  std::mutex mutex;
  std::condition_variable changed;
  std::shared_ptr<const config::StorebagSection> section = config::parseSection({});
  std::optional<std::string> conditional;
  std::string newLastModified;
  std::int32_t age = 3600;
  double share = 0;
  bool answersNotModified = false;
  bool attempts = true;
  bool hold = false;
  bool lacksMemory = false;
  bool expired = false;
  int fetches = 0;
};

class Cache : public ::testing::Test {
 protected:
  std::shared_ptr<const config::StorebagSection> ask(std::int32_t clientType) {
    return cache.storebagForClientType(clientType);
  }
  std::optional<std::string> version(std::int32_t clientType) {
    return cache.versionForClientType(clientType);
  }

  RecordedLog log;
  FakeClock clock;
  Source source;
  daemon::StorebagCache cache{source, clock};
};

// Nothing is recorded, so the next session asks again at once.
TEST_F(Cache, ADownloadThatWasNoAttemptLeavesTheRecordAsItWas) {
  source.attempts = false;
  const auto standsIn = config::parseSection({{"mivo", Dictionary{}}});
  source.section = nullptr;
  EXPECT_EQ(ask(7), nullptr);
  source.section = standsIn;
  EXPECT_EQ(ask(7), standsIn);
  EXPECT_EQ(version(7), std::nullopt);
  source.attempts = true;
  const auto kept = config::parseSection({{"httppost", Dictionary{}}});
  source.section = kept;
  source.age = 100;
  EXPECT_EQ(ask(7), kept);
  EXPECT_EQ(source.fetches, 3);
  clock.advance(101);
  source.attempts = false;
  source.newLastModified = "later";
  for (const auto& section : {standsIn, std::shared_ptr<const config::StorebagSection>()}) {
    source.section = section;
    EXPECT_EQ(ask(7), kept);
  }
  source.attempts = true;
  source.answersNotModified = true;
  EXPECT_EQ(ask(7), kept);
  EXPECT_EQ(source.fetches, 6);
  EXPECT_EQ(source.conditional, std::nullopt);
}

TEST_F(Cache, TypesThatShareAStorebagShareOneDownload) {
  EXPECT_NE(ask(7), nullptr);
  EXPECT_EQ(ask(13), ask(7));
  EXPECT_EQ(source.fetches, 1);
  EXPECT_EQ(version(13), "v1");
  clock.advance(3599);
  ask(7);
  EXPECT_EQ(source.fetches, 1);
  clock.advance(1);
  ask(7);
  EXPECT_EQ(source.fetches, 2);
  clock.advance(-86'400);
  ask(7);
  EXPECT_EQ(source.fetches, 3);
}

TEST_F(Cache, AFailureIsRetriedAfter900SecondsAndKeepsWhatWasThere) {
  source.age = 0;
  source.newLastModified = "Monday";
  const auto section = ask(7);
  log.expectLine(RecordedLog::Level::error,
                 "fetchAndCacheStorebag: Unable to fetch storebag for client type 7");
  source.section.reset();
  EXPECT_EQ(ask(7), section);
  EXPECT_EQ(source.conditional, "Monday");
  clock.advance(899);
  EXPECT_EQ(ask(7), section);
  EXPECT_EQ(source.fetches, 2);
  EXPECT_EQ(log.count(RecordedLog::Level::info,
                      "storebagForSession: Not fetching storebag for client type 7 - must wait 900 seconds "
                      "between attempts"),
            1);
  clock.advance(1);
  source.answersNotModified = true;
  source.age = 60;
  EXPECT_EQ(ask(7), section);
  EXPECT_EQ(source.fetches, 3);
  clock.advance(59);
  EXPECT_EQ(ask(7), section);
  EXPECT_EQ(source.fetches, 3);
}

TEST_F(Cache, WhatHasExpiredIsNotServedAndMustComeWhole) {
  source.newLastModified = "Monday";
  const auto section = ask(7);
  EXPECT_EQ(cache.standingForClientType(7).section, section);
  EXPECT_FALSE(cache.standingForClientType(7).due);
  source.expired = true;
  log.expectLine(RecordedLog::Level::error, "Storebag '' refused: expired on Monday");
  EXPECT_EQ(cache.standingForClientType(13).section, nullptr);
  EXPECT_TRUE(cache.standingForClientType(7).due);
  log.expectLine(RecordedLog::Level::error,
                 "fetchAndCacheStorebag: Unable to fetch storebag for client type 7");
  source.section.reset();
  EXPECT_EQ(ask(7), nullptr);
  EXPECT_EQ(source.conditional, std::nullopt);
  clock.advance(899);
  EXPECT_EQ(ask(7), nullptr);
  EXPECT_EQ(source.fetches, 2);
  EXPECT_FALSE(cache.standingForClientType(7).due);
  source.expired = false;  // the clock was wrong
  EXPECT_EQ(ask(7), section);
}

TEST_F(Cache, ATypeWithoutAStorebagLeavesNoRecord) {
  source.section.reset();
  EXPECT_EQ(ask(2), nullptr);
  EXPECT_EQ(ask(2), nullptr);
  EXPECT_EQ(source.fetches, 2);
  EXPECT_EQ(version(2), std::nullopt);
}

TEST_F(Cache, AFetchThatLackedMemoryIsOverForThoseWhoWait) {
  source.hold = source.lacksMemory = true;
  std::shared_ptr<const config::StorebagSection> second;
  std::thread fetching([&] { EXPECT_THROW(ask(7), std::bad_alloc); });
  source.waitForFetches(1);
  std::thread waiting([&] { second = ask(11); });
  source.letGo();
  fetching.join();
  waiting.join();
  EXPECT_NE(second, nullptr);
}

// The verdict on a storebag's age just after a fetch or a failure.
TEST(StorebagAge, AgeAndOutcomeDecide) {
  using enum daemon::CacheVerdict;
  struct Case {
    bool attempted, successful;
    double age;
    daemon::CacheVerdict verdict;
  };
  for (const Case& c : std::vector<Case>{{false, false, 0, fetch},
                                         {false, true, 0, fetch},
                                         {true, true, 0, serve},
                                         {true, true, 99.9, serve},
                                         {true, true, 100, fetch},
                                         {true, true, -99, serve},
                                         {true, true, -100, fetch},
                                         {true, false, 0, wait},
                                         {true, false, 899.9, wait},
                                         {true, false, 900, fetch},
                                         {true, false, -899, wait},
                                         {true, false, -901, fetch}}) {
    daemon::StorebagAge record;
    record.ended(c.successful, 100, 5'000, 0.9);
    record.attempted = c.attempted;
    EXPECT_EQ(daemon::verdictOfAge(record, 5'000 + c.age, 0), c.verdict) << c.age;
  }
}

// The wait between two attempts, by their results; a max age of 0 means that there was no answer.
TEST(StorebagAge, JitterSpreadsTheWaits) {
  struct Attempt {
    bool successful;
    std::int32_t told;
  };
  struct Case {
    std::vector<Attempt> attempts;
    double jitter, draw, wait;
  };
  const Attempt hour{true, 3'600}, failure{false, 0};
  for (const Case& c :
       std::vector<Case>{{{hour}, 0, 0.5, 3'600},
                         {{hour}, 0.5, 0, 3'600},
                         {{hour}, 0.5, 0.5, 2'700},
                         {{hour}, 1, 0.75, 900},
                         {{{true, 0}}, 1, 0.5, 0},
                         {{failure}, 0, 0.5, 900},
                         {{failure}, 0.5, 0.5, 1'125},  // nothing was ever told
                         {{hour, failure}, 0, 0.5, 900},
                         {{hour, failure}, 0.5, 0, 900},
                         {{hour, failure}, 0.5, 0.5, 1'800},
                         {{hour, failure, failure}, 1, 0.5, 2'700},
                         {{hour, {false, 60}}, 1, 0.5, 2'700},  // what a failure was told counts not
                         {{{true, 60}, failure}, 1, 0.5, 1'350},
                         {{{true, 1'000'000}, failure}, 1, 0.5, 44'100},
                         {{failure, hour}, 0.5, 0.5, 2'700}}) {
    daemon::StorebagAge age;
    for (const Attempt& attempt : c.attempts) age.ended(attempt.successful, attempt.told, 5'000, c.draw);
    EXPECT_DOUBLE_EQ(age.wait(c.jitter), c.wait);
    if (c.wait > 0) {
      const auto before = daemon::verdictOfAge(age, 5'000 + c.wait - 0.001, c.jitter);
      EXPECT_EQ(before,
                c.attempts.back().successful ? daemon::CacheVerdict::serve : daemon::CacheVerdict::wait);
    }
    EXPECT_EQ(daemon::verdictOfAge(age, 5'000 + c.wait, c.jitter), daemon::CacheVerdict::fetch);
  }
}

// 40 storebags that were fetched at one time become old at different ones.
TEST_F(Cache, EachFetchDrawsAnew) {
  source.share = 0.5;
  source.age = 100;
  int later = 0;
  for (int fetch = 1; fetch <= 40; ++fetch) {
    ask(7);
    EXPECT_EQ(source.fetches, fetch);
    clock.advance(49.9);
    ask(7);
    EXPECT_EQ(source.fetches, fetch);
    clock.advance(25.1);
    later += !cache.standingForClientType(7).due;
    clock.advance(25.1);
  }
  EXPECT_TRUE(later > 0 && later < 40) << later;
}

TEST_F(Cache, OthersGoOnDuringADownloadAndTheSameNameWaits) {
  source.hold = true;
  std::shared_ptr<const config::StorebagSection> first, second;
  std::thread fetching([&] { first = ask(7); });
  source.waitForFetches(1);
  std::thread waiting([&] { second = ask(11); });
  EXPECT_EQ(version(6), std::nullopt);  // the lock is free
  source.letGo();
  fetching.join();
  waiting.join();
  EXPECT_EQ(source.fetches, 1);
  EXPECT_NE(first, nullptr);
  EXPECT_EQ(first, second);
}

}  // namespace
}  // namespace veltrad
