// SPDX-License-Identifier: Apache-2.0
// Open calls: which of them an answer, an event or the end of the connection ends.
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
  constexpr std::uint32_t kLastID = 0xffffffff;
  const auto file = std::make_shared<client::UploadedFile>("missing");
  const auto callback = [](void*, const veltra_reply*) {};
  client::Waiter waiter, left;
  CallTable calls;
  EXPECT_FALSE(CallTable::Call{}.awaitsAnswer());
  calls.add(1, {&waiter, nullptr, nullptr, nullptr});
  calls.add(2, {nullptr, callback, nullptr, nullptr});
  calls.add(3, {nullptr, nullptr, nullptr, file});
  calls.add(kLastID - 1, {nullptr, callback, nullptr, nullptr});
  calls.add(kLastID, {&left, nullptr, nullptr, nullptr});
  EXPECT_EQ(calls.takeID(), 4u);  // neither 0 nor one that is under way
  for (std::size_t i = 0; i < client::kMostWaitingEvents + 2; ++i) calls.addEvent({});
  for (const std::uint32_t answered : {7u, 1u, 1u, 2u, 2u})
    calls.answer(answered, done(std::to_string(answered).c_str()));
  EXPECT_EQ(calls.unwaited(), 2u);
  const auto waiting = ready(calls);  // events are bounded, answers are not
  EXPECT_EQ(waiting.size(), client::kMostWaitingEvents + 1);
  EXPECT_EQ(waiting.back(), "2");
  calls.addEvent({});
  EXPECT_EQ(ready(calls), std::vector<std::string>{"event"});
  EXPECT_EQ(calls.counts().dropped_events, 2u);
  ASSERT_TRUE(waiter.answer && !left.answer);
  EXPECT_EQ(waiter.answer->text, "1");
  for (const std::uint32_t callID : {2u, kLastID, 3u}) {
    EXPECT_FALSE(file->removalAsked());
    calls.askForRemoval(callID);
  }
  EXPECT_TRUE(file->removalAsked());
  calls.endAllBut({kLastID}, VELTRA_NO_REPLY, "gone");
  ASSERT_FALSE(left.answer);  // it waits for the next connection
  for (const char* why : {"gone for good", "gone again"}) calls.endAllBut({}, VELTRA_NO_REPLY, why);
  ASSERT_TRUE(left.answer);
  EXPECT_EQ(left.answer->error->description, "gone for good");
  std::deque<CallTable::Ready> batch;
  calls.takeReady(batch);
  ASSERT_EQ(batch.size(), 2u);
  EXPECT_EQ(batch[0].callback, +callback);  // the oldest first, although IDs have wrapped
  EXPECT_EQ(batch[1].answer->file, file);
  EXPECT_EQ(calls.counts().replies, 2u);
  EXPECT_EQ(calls.counts().unanswered, 3u);
}

}  // namespace
}  // namespace veltrad::client_test
