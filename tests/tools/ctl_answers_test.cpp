// The lines that veltractl prints, byte for byte.
#include <gtest/gtest.h>

#include "tools/ctl/answers.h"
#include "tools/ctl/counters_report.h"

namespace veltrad::ctl {
namespace {

Answer withReply(std::string text) {
  Answer answer;
  answer.reply = std::move(text);
  return answer;
}

Answer withBackends(std::vector<std::string> names) {
  Answer answer;
  answer.backends = std::move(names);
  return answer;
}

Answer withError(veltra_status status) {
  Answer answer;
  answer.status = status;
  answer.error = AnswerError{"com.florn.veltra.error", 503, "The server said \"no\"."};
  return answer;
}

TEST(Answers, standInOneLineOpFirst) {
  const char* error =
      R"("error":{"domain":"com.florn.veltra.error","code":503,"description":"The server said \"no\"."}})";
  const struct {
    Operation operation;
    Answer answer;
    std::string line;
  } cases[] = {
      {Operation::start, Answer(), R"({"op":"start","backends":null})"},
      {Operation::start, withBackends({}), R"({"op":"start","backends":[]})"},
      {Operation::restart, withBackends({"httppost", "a\"b"}),
       R"({"op":"restart","backends":["httppost","a\"b"]})"},
      {Operation::states, withBackends({"dashboard"}), R"({"op":"states","backends":["dashboard"]})"},
      {Operation::send, withReply("two\nlines"), R"({"op":"send","reply":"two\nlines"})"},
      {Operation::send, withReply(""), R"({"op":"send","reply":""})"},
      {Operation::send, Answer(), R"({"op":"send","reply":null})"},
      {Operation::send, withError(VELTRA_NO_REPLY), std::string(R"({"op":"send","reply":null,)") + error},
      // The call was answered, so what stands in its error is no answer to a send.
      {Operation::send, withError(VELTRA_OK), R"({"op":"send","reply":null})"},
      {Operation::flush, withReply("flushed"), R"({"op":"flush","reply":"flushed","error":null})"},
      {Operation::flush, withError(VELTRA_OK), std::string(R"({"op":"flush","reply":null,)") + error},
      {Operation::states, withError(VELTRA_NO_DAEMON),
       std::string(R"({"op":"states","backends":null,)") + error},
      {Operation::displayURL, withReply("https://x/"), R"({"op":"displayURL","reply":"https://x/"})"},
      {Operation::finish, Answer(), R"({"op":"finish","reply":null})"},
      {Operation::sleep, Answer(), R"({"op":"sleep"})"},
  };
  for (const auto& c : cases) EXPECT_EQ(formatAnswer(c.operation, c.answer), c.line);
}

TEST(Answers, nameTheMalformedLine) {
  EXPECT_EQ(formatMalformedLine(12, "unknown op \"x\""),
            R"({"op":"error","line":12,"description":"unknown op \"x\""})");
}

TEST(Answers, aCopyStandsInOneLineWithNullForNothing) {
  EXPECT_EQ(formatAggregated({Dictionary{{"sessionID", 42u}}, 1416171234.25, 5, 65535,
                              Dictionary{{"at", Date{7}}, {"text", "a\nb"}}}),
            R"({"op":"aggregated","sessionInfo":{"sessionID":42},"timestamp":1416171234.25,"category":5,)"
            R"("type":65535,"payload":{"at":{"$date":7.0},"text":"a\nb"}})");
  EXPECT_EQ(formatAggregated({}),
            R"({"op":"aggregated","sessionInfo":null,"timestamp":0.0,"category":0,"type":0,"payload":null})");
}

TEST(Answers, aCallThatNeverLeftSaysWhy) {
  const Answer answer = answerOfFailure(VELTRA_QUEUE_FULL);
  EXPECT_EQ(answer.status, VELTRA_QUEUE_FULL);
  ASSERT_TRUE(answer.error);
  EXPECT_EQ(answer.error->description, veltra_status_text(VELTRA_QUEUE_FULL));
}

TEST(CountersReport, isATableInOrderOfTheReasons) {
  const auto report = readCounters(
      R"({"pid":42,"started":1700000000.5,"counts":{"message sent":1200,"event dropped: no user info":7}})");
  ASSERT_TRUE(report);
  EXPECT_EQ(formatCounters(*report),
            "veltrad, process 42, started 2023-11-14 22:13:20 UTC\n"
            "\n"
            "count  reason\n"
            "    7  event dropped: no user info\n"
            " 1200  message sent");
}

TEST(CountersReport, saysThatNothingWasCounted) {
  const auto report = readCounters(R"({"pid":42,"started":1700000000,"counts":{}})");
  ASSERT_TRUE(report);
  EXPECT_EQ(formatCounters(*report),
            "veltrad, process 42, started 2023-11-14 22:13:20 UTC\nnothing counted yet");
}

TEST(CountersReport, isNothingForAnythingElse) {
  for (const char* text : {"", "{", "[]", R"({"pid":1,"started":2})",
                           R"({"pid":"1","started":2,"counts":{}})", R"({"pid":1,"counts":{}})"}) {
    EXPECT_FALSE(readCounters(text)) << text;
  }
}

}  // namespace
}  // namespace veltrad::ctl
