// SPDX-License-Identifier: Apache-2.0
// The queue of waiting requests: which one runs next.
#include "http/http_queue.h"

#include <gtest/gtest.h>

namespace veltrad::platform {
namespace {

using namespace std::chrono_literals;
using Lane = http::HTTPRequest::Lane;

constexpr http::CurlTransfer::Time kNow{};

// What comes: as many as said, one after the other; `sequence` of events alone.
struct Come {
  Lane lane;
  const char* host;
  int count = 1;
  std::uintptr_t sequence = 0;
};

struct Case {
  const char* what;
  std::vector<Come> comes;
  std::string runs;                 // hosts' letters in the order in which they begin at once
  std::string afterFirstEnds = "";  // what then begins
  std::chrono::milliseconds later = 0ms;
  std::string runsLater = "";
};

class Requests {
 public:
  explicit Requests(const Case& c) {
    for (const Come& come : c.comes) {
      for (int i = 0; i < come.count; ++i) {
        http::HTTPRequest request;
        request.lane = come.lane;
        request.url = std::string("https://") + come.host + "/path";
        request.sequence = come.sequence;
        request.timeout = 1s;
        http::HTTPQueue::Transfers one;
        one.emplace_back(std::move(request), nullptr, false, kNow);
        EXPECT_NE(queue.add(one), http::HTTPQueue::Added::full);
      }
    }
  }
  std::string begin(std::chrono::milliseconds after) {
    std::string hosts;
    for (auto one = queue.next(kNow + after); !one.empty(); one = queue.next(kNow + after)) {
      hosts += one.front().host();
      running.splice(running.end(), one);
    }
    return hosts;
  }
  void endFirst() {
    if (running.empty()) return;
    queue.ended(running.front());
    running.pop_front();
  }

  http::HTTPQueue queue;
  http::HTTPQueue::Transfers running;
};

TEST(HTTPQueue, WhatRunsNext) {
  const Case cases[] = {
      {"storebags are never held back, and go first",
       {{Lane::event, "a", 7}, {Lane::storebag, "a", 9}},
       "aaaaaaaaaaaaaaa",
       ""},
      {"posts have six places on a host, which others do not wait for",
       {{Lane::event, "a", 8}, {Lane::event, "b", 2}},
       "aaaaaabb",
       "a"},
      {"one of a sequence at a time, for a tenth of a second",
       {{Lane::event, "a", 3, 1}, {Lane::event, "b", 2, 1}, {Lane::event, "c", 2, 2}},
       "abc",
       "a",
       99ms,
       ""},
      {"then all of it", {{Lane::event, "a", 3, 1}, {Lane::event, "a", 2, 2}}, "aa", "a", 100ms, "aa"},
      {"three uploads, three of log data", {{Lane::upload, "a", 5}, {Lane::logData, "b", 5}}, "aaabbb", "a"},
      {"on one host four of both, which leave two places to posts",
       {{Lane::upload, "a", 5}, {Lane::logData, "a", 5}, {Lane::event, "a", 5}},
       "aaaaaa",
       "a"},
      {"a host that is full does not hold its lane up",
       {{Lane::upload, "a", 3}, {Lane::logData, "a", 2}, {Lane::logData, "b", 1}},
       "aaaab",
       "a"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Requests run(c);
    EXPECT_EQ(run.begin(0ms), c.runs);
    run.endFirst();
    EXPECT_EQ(run.begin(0ms), c.afterFirstEnds);
    EXPECT_EQ(run.begin(c.later), c.runsLater);
    while (!run.running.empty()) {
      run.endFirst();
      run.begin(0ms);
    }
    EXPECT_TRUE(run.queue.empty());  // every place was given back, so all could run
  }
}

TEST(HTTPQueue, TakesOutWhatIsExpiredButNotWhatWaitsForItsLane) {
  Requests run(
      {"",
       {{Lane::event, "a", 2}, {Lane::logData, "b", 1}, {Lane::storebag, "c", 1}, {Lane::upload, "d", 1}},
       ""});
  const auto expired = [](auto after) {
    return [now = kNow + after](const http::CurlTransfer& transfer) { return transfer.expired(now); };
  };
  EXPECT_EQ(run.queue.take(expired(999ms)).size(), 0u);
  EXPECT_EQ(run.queue.take(expired(1s)).size(), 3u);
  EXPECT_EQ(run.begin(2s), "db");
}

}  // namespace
}  // namespace veltrad::platform
