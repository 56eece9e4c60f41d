// The lines that veltractl prints, byte for byte.
#include <gtest/gtest.h>

#include "tools/ctl/answers.h"
#include "tools/ctl/counters_report.h"

namespace veltrad::ctl {
namespace {

Answer withReply(std::string text) {
  return {VELTRA_OK, std::move(text), std::nullopt, std::nullopt};
}
Answer withBackends(std::vector<std::string> names) {
  return {VELTRA_OK, std::nullopt, std::move(names), std::nullopt};
}
Answer withError(veltra_status status) {
  return {status, std::nullopt, std::nullopt, AnswerError{"com.florn.veltra.error", 503, "It said \"no\"."}};
}

TEST(Answers, standInOneLineOpFirst) {
  const std::string error =
      R"("error":{"domain":"com.florn.veltra.error","code":503,"description":"It said \"no\"."}})";
  const std::pair<std::string, std::string> cases[] = {
      {formatAnswer(Operation::start, Answer()), R"({"op":"start","backends":null})"},
      {formatAnswer(Operation::start, withBackends({})), R"({"op":"start","backends":[]})"},
      {formatAnswer(Operation::restart, withBackends({"a", "b\"c"})),
       R"({"op":"restart","backends":["a","b\"c"]})"},
      {formatAnswer(Operation::states, withError(VELTRA_NO_DAEMON)),
       R"({"op":"states","backends":null,)" + error},
      {formatAnswer(Operation::send, withReply("two\nlines")), R"({"op":"send","reply":"two\nlines"})"},
      {formatAnswer(Operation::send, withError(VELTRA_NO_REPLY)), R"({"op":"send","reply":null,)" + error},
      // The call was answered, so what stands in its error is no answer to a send.
      {formatAnswer(Operation::send, withError(VELTRA_OK)), R"({"op":"send","reply":null})"},
      {formatAnswer(Operation::flush, withReply("")), R"({"op":"flush","reply":"","error":null})"},
      {formatAnswer(Operation::flush, withError(VELTRA_OK)), R"({"op":"flush","reply":null,)" + error},
      {formatAnswer(Operation::finish, Answer()), R"({"op":"finish","reply":null})"},
      {formatAnswer(Operation::sleep, Answer()), R"({"op":"sleep"})"},
      {formatMalformedLine(12, "op \"x\""), R"({"op":"error","line":12,"description":"op \"x\""})"},
      {formatAggregated({Dictionary{{"sessionID", 42u}}, 1416171234.25, 5, 65535,
                         Dictionary{{"at", Date{7}}, {"text", "a\nb"}}}),
       R"({"op":"aggregated","sessionInfo":{"sessionID":42},"timestamp":1416171234.25,"category":5,)"
       R"("type":65535,"payload":{"at":{"$date":7.0},"text":"a\nb"}})"},
      {formatAggregated({}),
       R"({"op":"aggregated","sessionInfo":null,"timestamp":0.0,"category":0,"type":0,"payload":null})"},
  };
  for (const auto& [line, expected] : cases) EXPECT_EQ(line, expected);
}

TEST(Answers, aCallThatNeverLeftSaysWhy) {
  const Answer answer = answerOfFailure(VELTRA_QUEUE_FULL);
  EXPECT_EQ(answer.status, VELTRA_QUEUE_FULL);
  ASSERT_TRUE(answer.error);
  EXPECT_EQ(answer.error->description, veltra_status_text(VELTRA_QUEUE_FULL));
}

TEST(CountersReport, isATableInOrderOfTheReasonsOrNothing) {
  const auto report =
      readCounters(R"({"pid":42,"started":1700000000.5,"counts":{"sent":1200,"dropped: no":7}})");
  ASSERT_TRUE(report);
  EXPECT_EQ(formatCounters(*report),
            "veltrad, process 42, started 2023-11-14 22:13:20 UTC\n\n"
            "count  reason\n"
            "    7  dropped: no\n"
            " 1200  sent");
  const auto none = readCounters(R"({"pid":42,"started":1700000000,"counts":{}})");
  ASSERT_TRUE(none);
  EXPECT_EQ(formatCounters(*none),
            "veltrad, process 42, started 2023-11-14 22:13:20 UTC\nnothing counted yet");
  for (const char* text : {"", "[]", R"({"pid":1,"started":2})", R"({"pid":"1","started":2,"counts":{}})",
                           R"({"pid":1,"counts":{}})"})
    EXPECT_FALSE(readCounters(text)) << text;
}

}  // namespace
}  // namespace veltrad::ctl
