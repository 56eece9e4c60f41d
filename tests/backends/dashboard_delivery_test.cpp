// SPDX-License-Identifier: Apache-2.0
// The delivery of a dashboard datagram after its first transmission, with ticks and a time that the test
// sets.
#include <gtest/gtest.h>

#include <set>
#include <string>
#include <vector>

#include "backends/dashboard/delivery_schedule.h"
#include "backends/dashboard/message_queue.h"

namespace veltrad {
namespace {

using namespace std::chrono_literals;
using Verdict = backends::DeliverySchedule::Verdict;

// A network that accepts datagrams on some ticks; the first transmission is tick 0. On other ticks they may
// not leave.
struct Network {
  explicit Network(std::set<int> closedAt, std::set<int> forbiddenAt = {})
      : closed(std::move(closedAt)), forbidden(std::move(forbiddenAt)) {}
  const std::set<int> closed;
  const std::set<int> forbidden;
  int now = 0;
  std::vector<int> sentAt;
  std::vector<std::string> sent;

  backends::MessageQueue::Send send() {
    return [this](std::string_view datagram, bool) {
      using Sending = backends::MessageQueue::Sending;
      if (forbidden.contains(now)) return Sending::forbidden;
      if (closed.contains(now)) return Sending::notTaken;
      sentAt.push_back(now);
      sent.emplace_back(datagram);
      return Sending::done;
    };
  }
};

TEST(DashboardDelivery, ADatagramIsSentUntilItsRulesLetItGo) {
  struct Case {
    bool reliable;
    std::set<int> closed;
    std::vector<int> sentAt;
    int leavesAt;  // 0: never waited
    std::set<int> forbidden = {};
  };
  for (const Case& c :
       std::vector<Case>{{true, {}, {0, 2, 5, 10, 19}, 20},
                         {true, {2, 3}, {0, 4, 7, 12, 21}, 22},     // a retransmission is tried again
                         {true, {0, 1, 2}, {3, 5, 8, 13, 22}, 23},  // counted from the first that went out
                         {false, {}, {0}, 0},                       // sent is done
                         {false, {0, 1, 2}, {3}, 3},
                         {true, {}, {0, 2}, 5, {5}},
                         {true, {}, {}, 0, {0}},
                         {true, {0}, {1, 3}, 6, {6}},
                         {true, {0}, {}, 1, {1}},  // one that was held has not left before
                         {false, {0, 1}, {}, 2, {2}}}) {
    Network network(c.closed, c.forbidden);
    backends::MessageQueue queue(c.reliable, false, network.send());
    EXPECT_EQ(queue.tryToSendMsg("datagram", 1, platform::Charge()).fate,
              c.forbidden.contains(0) ? wire::Reason::datagram_over_daily_limit
              : c.closed.contains(0)  ? wire::Reason::datagram_held
                                      : wire::Reason::datagram_sent);
    std::size_t givenUp = 0, forbidden = 0;
    while (!queue.empty() && network.now < 100) {
      ++network.now;
      const auto tick = queue.tick();
      givenUp += tick.givenUp;
      forbidden += tick.forbidden;
    }
    EXPECT_EQ(network.sentAt, c.sentAt);
    EXPECT_EQ(network.now, c.leavesAt);
    EXPECT_EQ(forbidden, c.forbidden.empty() || c.forbidden.contains(0) ? 0u : 1u);
    EXPECT_EQ(givenUp, c.reliable && c.forbidden.empty() ? 1u : 0u);
  }
}

TEST(DashboardDelivery, SoManyWaitAndTheOldestMakesRoom) {
  for (const auto& [shared, most] : {std::pair{false, 50}, {true, 1024}}) {
    Network network({0});
    backends::MessageQueue queue(false, shared, network.send());
    EXPECT_EQ(queue.tryToSendMsg("nobody pays", 0, std::nullopt).fate, wire::Reason::no_memory_to_hold);
    for (int event = 0; event <= most; ++event) {
      const auto pushedOut = queue.tryToSendMsg(std::to_string(event), 1, platform::Charge()).pushedOut;
      EXPECT_EQ(pushedOut.has_value(), event == most);
      if (pushedOut) {
        EXPECT_NE(entryOf(*pushedOut).text.find(std::to_string(most)), std::string_view::npos);
      }
    }
    ++network.now;
    EXPECT_EQ(queue.tick().sent, std::size_t(most));
    EXPECT_EQ(network.sent.front(), "1");
    EXPECT_EQ(network.sent.back(), std::to_string(most));
    EXPECT_TRUE(queue.empty());
  }
}

TEST(DashboardDelivery, AnAcknowledgementRemovesTheOldestOfItsNumber) {
  Network network({1});
  backends::MessageQueue queue(true, false, network.send());
  for (const char* datagram : {"older", "other", "newer"}) {
    queue.tryToSendMsg(datagram, datagram == std::string("other") ? 8 : 7,
                       platform::Charge());  // 7 has come round again
  }
  ++network.now;
  queue.tryToSendMsg("not sent yet", 9, platform::Charge());
  EXPECT_EQ(queue.acknowledge(6), std::nullopt);
  EXPECT_EQ(queue.acknowledge(7), wire::Reason::datagram_acknowledged);
  EXPECT_EQ(queue.acknowledge(9), wire::Reason::datagram_acknowledged);
  network.sent.clear();
  for (int i = 0; i < 2; ++i) ++network.now, queue.tick();
  EXPECT_EQ(network.sent, (std::vector<std::string>{"other", "newer"}));
}

// All of one number. "A": sent for the first time; ".": a tick, on which those that wait may go out again;
// "!": an acknowledgement.
TEST(DashboardDelivery, AnAcknowledgementOfASharedNumberAnswersOneCopy) {
  struct Case {
    std::string story;
    std::string waits;  // at its end
    std::string told;   // whose acknowledgements were told of, "?" if it may be another's
    bool idle;          // no answer can come that would be taken for that of the next one
  };
  for (const Case& c :
       std::vector<Case>{{"AB!", "B", "A?", false},
                         {"AB!!", "", "A?B", true},
                         {"A..!B!", "B", "A", false},        // the second was A's retransmission's
                         {"A..!B!!", "", "AB", true},        // and this is B's own
                         {"AB..!!!!C", "C", "A?B?", false},  // two copies of each
                         {"AB..!!C!!", "C", "A?B?", false},  // the same, C sent between
                         {"A..!B..!!", "", "AB", false},     // A's first copy was lost: B is sent once more
                         {"A..!.........B!", "B", "A",
                          false},  // the copy of the 2nd tick may still be answered on the 11th
                         {"A..!..........B!", "", "AB", true},  // on the 12th no more
                         {"A..!", "", "A", false},
                         {"A..!..........", "", "A", true},
                         {"A!!B", "B", "A", false}}) {
    Network network({});
    std::string told;
    backends::MessageQueue queue(true, true, network.send(), {},
                                 [&](std::uint64_t message, wire::Step step, wire::Reason how) {
                                   if (step == wire::Step::acknowledged) told += static_cast<char>(message);
                                   if (how == wire::Reason::acknowledged_by_number) told += '?';
                                 });
    for (const char step : c.story) {
      if (step == '.') {
        queue.tick();
      } else if (step == '!') {
        queue.acknowledge(1);
      } else {
        queue.tryToSendMsg(std::string(1, step), 1, platform::Charge(), {}, std::uint64_t(step));
      }
    }
    EXPECT_EQ(told, c.told) << c.story;
    EXPECT_EQ(queue.idle(), c.idle) << c.story;
    network.sent.clear();
    const std::size_t waiting = queue.size();
    while (!queue.empty()) queue.tick();
    std::string waits;
    for (std::size_t i = 0; i < waiting && i < network.sent.size(); ++i) waits += network.sent[i];
    EXPECT_EQ(waits, c.waits) << c.story;
    EXPECT_EQ(waiting, c.waits.size()) << c.story;
  }
}

TEST(DashboardDelivery, TicksStandAtMultiplesAndOnlyWhileSomethingWaits) {
  const backends::DeliverySchedule::Time made{1h};
  backends::DeliverySchedule schedule(made, 250ms);
  EXPECT_EQ(schedule.next(made + 10ms, false), std::nullopt);
  EXPECT_FALSE(schedule.tickIsDue(made + 1h));
  for (const auto& [now, next] : std::vector<std::pair<std::chrono::milliseconds, std::chrono::milliseconds>>{
           {0ms, 250ms}, {249ms, 250ms}, {250ms, 500ms}, {3600'001ms, 3600'250ms}}) {
    EXPECT_EQ(schedule.next(made + now, true), made + next);
    EXPECT_FALSE(schedule.tickIsDue(made + next - 1ms));
    EXPECT_TRUE(schedule.tickIsDue(made + next));
  }
}

TEST(DashboardDelivery, CleanUpWaitsForDatagramsUntilTheLastResort) {
  const backends::DeliverySchedule::Time made{};
  backends::DeliverySchedule idle(made, 500ms);
  EXPECT_EQ(idle.cleanup(false), Verdict::stop);

  backends::DeliverySchedule schedule(made, 500ms);
  EXPECT_EQ(schedule.afterTick(made + 500ms, false), Verdict::goOn);
  EXPECT_EQ(schedule.cleanup(true), Verdict::goOn);
  EXPECT_EQ(schedule.next(made + 600ms, false), made + 1000ms);  // acknowledged since, but not stopped
  EXPECT_EQ(schedule.afterTick(made + 1000ms, true), Verdict::lastResortScheduled);
  EXPECT_EQ(schedule.afterTick(made + 1500ms, true), Verdict::goOn);
  EXPECT_EQ(schedule.next(made + 10'400ms, true), made + 10'500ms);
  EXPECT_FALSE(schedule.lastResortIsDue(made + 10'499ms));
  EXPECT_TRUE(schedule.lastResortIsDue(made + 10'500ms));
  EXPECT_EQ(schedule.afterTick(made + 10'500ms, false), Verdict::stop);
  schedule.resume();
  EXPECT_FALSE(schedule.lastResortIsDue(made + 10'500ms));
  EXPECT_EQ(schedule.next(made + 10'500ms, false), std::nullopt);
}

}  // namespace
}  // namespace veltrad
