// Calls under way: which of them an answer, an event or the end of the connection reaches.
#include "client/call_table.h"

#include <gmock/gmock.h>

#include "harness.h"

namespace veltrad::client_test {
namespace {

using client::CallTable;

client::Answer done(const char* text) {
  auto answer = client::answerOfStatus(VELTRA_OK);
  answer->text = text;
  return answer;
}

// What is there for callbacks and events now: each answer's text, or the error in its place.
std::vector<std::string> ready(CallTable& calls) {
  std::deque<CallTable::Ready> batch;
  calls.takeReady(batch);
  std::vector<std::string> texts;
  for (const CallTable::Ready& item : batch) {
    if (!item.answer) texts.push_back("event");
    if (item.answer) texts.push_back(item.answer->text.value_or(veltra_status_text(item.answer->status)));
  }
  return texts;
}

TEST(CallTable, EndsEachCallOnceAndWhereItIsAwaited) {
  const auto file = std::make_shared<client::UploadedFile>("missing");
  const auto callback = [](void*, const veltra_reply*) {};
  client::Waiter waiter, left;
  CallTable calls;
  constexpr std::uint32_t kLastID = 0xffffffff;
  for (const auto& [callID, call] : std::vector<std::pair<std::uint32_t, CallTable::Call>>{
           {1, {&waiter, nullptr, nullptr, nullptr}},
           {2, {nullptr, callback, nullptr, nullptr}},
           {3, {nullptr, nullptr, nullptr, file}},
           {kLastID - 1, {nullptr, callback, nullptr, nullptr}},
           {kLastID, {&left, nullptr, nullptr, nullptr}}}) {
    EXPECT_TRUE(call.awaitsAnswer());
    EXPECT_EQ(calls.freeID(), callID == kLastID - 1 ? 4 : callID);
    calls.add(callID, call);
  }
  EXPECT_EQ(calls.freeID(), 4u);  // neither 0 nor one that is under way
  EXPECT_FALSE(CallTable::Call{}.awaitsAnswer());

  struct Step {
    std::uint32_t answered;
    std::size_t unwaited;  // afterwards
    std::vector<std::string> ready;
  };
  for (const Step& step : std::vector<Step>{{7, 3, {}}, {1, 3, {}}, {1, 3, {}}, {2, 2, {"2"}}, {2, 2, {}}}) {
    calls.answer(step.answered, done(std::to_string(step.answered).c_str()));
    EXPECT_EQ(calls.unwaited(), step.unwaited) << step.answered;
    EXPECT_EQ(ready(calls), step.ready) << step.answered;
  }
  ASSERT_TRUE(waiter.answer && !left.answer);
  EXPECT_EQ(waiter.answer->text, "1");

  for (const std::uint32_t callID : {2u, kLastID}) calls.askForRemoval(callID);
  EXPECT_FALSE(file->removalAsked());
  calls.askForRemoval(3);
  EXPECT_TRUE(file->removalAsked());

  calls.endAll("gone");
  calls.endAll("gone again");
  ASSERT_TRUE(left.answer);
  EXPECT_EQ(left.answer->error->description, "gone");
  std::deque<CallTable::Ready> batch;
  calls.takeReady(batch);
  ASSERT_EQ(batch.size(), 2u);
  EXPECT_EQ(batch[0].answer->file, file);  // the oldest first
  EXPECT_EQ(batch[1].callback, +callback);
  EXPECT_EQ(calls.unwaited(), 0u);
  EXPECT_EQ(calls.counts().replies, 2u);
  EXPECT_EQ(calls.counts().unanswered, 3u);
}

TEST(CallTable, BoundsEventsThatWaitAndNoAnswers) {
  CallTable calls;
  calls.add(1, {nullptr, nullptr, nullptr, std::make_shared<client::UploadedFile>("missing")});
  for (std::size_t i = 0; i < client::kMostWaitingEvents + 2; ++i) calls.addEvent({});
  calls.answer(1, done("after them"));
  EXPECT_EQ(calls.counts().dropped_events, 2u);
  const auto waiting = ready(calls);
  EXPECT_EQ(waiting.size(), client::kMostWaitingEvents + 1);
  EXPECT_EQ(waiting.back(), "after them");
  calls.addEvent({});
  EXPECT_EQ(ready(calls), std::vector<std::string>{"event"});
  EXPECT_EQ(calls.counts().dropped_events, 2u);
}

}  // namespace
}  // namespace veltrad::client_test
