// What a line of `veltractl session` says or what is wrong with it, and the table of the counters.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "base/json.h"
#include "tools/ctl/counters_report.h"
#include "tools/ctl/session_lines.h"

namespace veltrad::ctl {
namespace {

TEST(SessionLines, keepWhatTheySay) {
  // A send goes as it is, right or wrong; unknown fields elsewhere are passed over.
  for (const char* message : {R"({"category":"five","type":[1]})", R"({"category":70000,"flag":3,"type":-1})",
                              R"({"payload":{"at":{"$date":1700000000},"raw":{"$data":"AAE="}},"type":1})"}) {
    const auto line = parseSessionLine(std::string(R"( {"op":"send",)") + (message + 1) + "\r");
    ASSERT_TRUE(line.ok()) << message << ": " << line.error();
    EXPECT_EQ(line.value().operation, Operation::send);
    EXPECT_EQ(Value(line.value().message), parseJSON(message).value()) << message;
  }
  EXPECT_FALSE(parseSessionLine(R"({"op":"states","userInfo":null,"note":1})").value().userInfo);
  EXPECT_EQ(parseSessionLine(R"({"op":"states","userInfo":{}})").value().userInfo, Dictionary());
  EXPECT_EQ(parseSessionLine(R"({"op":"sleep","ms":3600000})").value().duration, kLongestSleep);
}

TEST(SessionLines, saysWhatIsWrong) {
  const std::pair<std::string, const char*> cases[] = {
      {"hello", "not JSON: at byte 0: "},
      {R"({"op":"flush"} {})", "not JSON: at byte 15: "},
      {"[1]", "expected an object such as {\"op\":\"flush\"}, found an array"},
      {R"({"$date":1})", "found a date"},
      {"{}",
       "no \"op\": expected one of send, flush, states, displayURL, uploadFile, uploadLogData, "
       "restart, sleep, finish"},
      {R"({"op":5})", "\"op\": expected a text, found an integer"},
      {R"({"op":"Send"})", "unknown op \"Send\": expected one of send,"},
      {R"({"op":"send","payload":{"$data":"AAE="}})", "\"payload\" of send: expected an object, found data"},
      {R"({"op":"send","flag":"3"})", "\"flag\" of send: expected an integer, found a text"},
      {R"({"op":"send","flag":1.5})", "of send: expected an integer, found a number with a fraction"},
      {R"({"op":"states","userInfo":[]})", "\"userInfo\" of states: expected an object, found an array"},
      {R"({"op":"uploadLogData"})", "no \"data\" in uploadLogData: expected an array"},
      {R"({"op":"uploadLogData","data":{}})",
       "\"data\" of uploadLogData: expected an array, found an object"},
      {R"({"op":"sleep"})", "no \"ms\" in sleep: expected an integer from 0 to 3600000"},
      {R"({"op":"sleep","ms":true})",
       "\"ms\" of sleep: expected an integer from 0 to 3600000, found a boolean"},
      {R"({"op":"sleep","ms":3600001})", "expected an integer from 0 to 3600000, found 3600001"},
      {R"({"op":"send","payload":{"a":[{"b\u0000c":1}]}})", "a key holds a NUL character"},
      {R"({"op":"flush"})" + std::string(kLongestLine, ' '),
       "the line is too long: expected at most 67108864 bytes"},
  };
  for (const auto& [text, description] : cases) {
    const auto line = parseSessionLine(text);
    ASSERT_FALSE(line.ok()) << description;
    EXPECT_THAT(line.error(), testing::HasSubstr(description));
    EXPECT_EQ(line.error().find('\n'), std::string::npos) << description;
  }
}

TEST(CountersReport, isATableInOrderOfTheReasons) {
  const auto report =
      readCounters(R"({"pid":42,"started":1700000000.5,"counts":{"sent":1200,"dropped: no":7}})");
  ASSERT_TRUE(report);
  EXPECT_EQ(formatCounters(*report),
            "veltrad, process 42, started 2023-11-14 22:13:20 UTC\n\n"
            "count  reason\n"
            "    7  dropped: no\n"
            " 1200  sent");
  for (const char* text : {"", "[]", R"({"pid":1,"started":2})", R"({"pid":"1","started":2,"counts":{}})",
                           R"({"pid":1,"counts":{}})"})
    EXPECT_FALSE(readCounters(text)) << text;
}

}  // namespace
}  // namespace veltrad::ctl
