// What a line of `veltractl session` says, and what is wrong with one that says nothing.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "base/json.h"
#include "tools/ctl/session_lines.h"

namespace veltrad::ctl {
namespace {

using testing::HasSubstr;

TEST(SessionLines, readsEveryOperation) {
  const struct {
    const char* line;
    Operation operation;
  } cases[] = {
      {R"({"op":"send"})", Operation::send},
      {R"({"op":"flush"})", Operation::flush},
      {R"( {"op":"states"} )", Operation::states},
      {"{\"op\":\"displayURL\"}\r", Operation::displayURL},
      {R"({"op":"restart","note":"unknown fields are ignored"})", Operation::restart},
      {R"({"op":"sleep","ms":0})", Operation::sleep},
      {R"({"op":"finish"})", Operation::finish},
  };
  for (const auto& c : cases) {
    const auto line = parseSessionLine(c.line);
    ASSERT_TRUE(line.ok()) << c.line << ": " << line.error();
    EXPECT_EQ(line.value().operation, c.operation) << c.line;
  }
}

TEST(SessionLines, aSendKeepsItsFieldsAsTheyAre) {
  const char* const messages[] = {
      R"({"category":5,"flag":3,"payload":{"codec":"opus","seconds":12.5},"type":1})",
      R"({"payload":{}})",
      R"({"category":"five","type":[1]})",
      R"({"category":70000,"type":-1})",
      R"({"category":1,"payload":{"at":{"$date":1700000000},"raw":{"$data":"AAE="}},"type":1})",
  };
  for (const char* message : messages) {
    const std::string text = std::string(R"({"op":"send",)") + (message + 1);
    const auto line = parseSessionLine(text);
    ASSERT_TRUE(line.ok()) << text << ": " << line.error();
    EXPECT_EQ(Value(line.value().message), parseJSON(message).value()) << text;
  }
}

TEST(SessionLines, statesWithoutUserInfoGivesNone) {
  EXPECT_FALSE(parseSessionLine(R"({"op":"states"})").value().userInfo);
  EXPECT_FALSE(parseSessionLine(R"({"op":"states","userInfo":null})").value().userInfo);
  const auto line = parseSessionLine(R"({"op":"states","userInfo":{"clientName":"phone"}})").value();
  ASSERT_TRUE(line.userInfo);
  EXPECT_EQ(*line.userInfo, Dictionary({{"clientName", "phone"}}));
  EXPECT_EQ(parseSessionLine(R"({"op":"states","userInfo":{}})").value().userInfo, Dictionary());
}

TEST(SessionLines, sleepsForMilliseconds) {
  EXPECT_EQ(parseSessionLine(R"({"op":"sleep","ms":250})").value().duration, std::chrono::milliseconds(250));
  EXPECT_EQ(parseSessionLine(R"({"op":"sleep","ms":3600000})").value().duration, kLongestSleep);
}

TEST(SessionLines, saysWhatIsWrong) {
  const struct {
    std::string line;
    const char* description;
  } cases[] = {
      {"hello", "not JSON: at byte 0: "},
      {R"({"op":"flush")", "not JSON: at byte 13: "},
      {R"({"op":"flush"} {})", "not JSON: at byte 15: "},
      {"[1]", "expected an object such as {\"op\":\"flush\"}, found an array"},
      {"7", "expected an object such as {\"op\":\"flush\"}, found an integer"},
      {R"({"$date":1})", "found a date"},
      {"{}", "no \"op\": expected one of send, flush, states, displayURL, restart, sleep, finish"},
      {R"({"op":null})", "no \"op\": "},
      {R"({"op":5})", "\"op\": expected a text, found an integer"},
      {R"({"op":"explode"})", "unknown op \"explode\": expected one of send,"},
      {R"({"op":"Send"})", "unknown op \"Send\""},
      {R"({"op":"start"})", "unknown op \"start\""},
      {R"({"op":"uploadFile","path":"x"})", "unknown op \"uploadFile\""},
      {R"({"op":"uploadLogData","data":[]})", "unknown op \"uploadLogData\""},
      {R"({"op":"send","payload":"x"})", "\"payload\" of send: expected an object, found a text"},
      {R"({"op":"send","payload":{"$data":"AAE="}})", "\"payload\" of send: expected an object, found data"},
      {R"({"op":"send","flag":"3"})", "\"flag\" of send: expected an integer, found a text"},
      {R"({"op":"send","flag":1.5})",
       "\"flag\" of send: expected an integer, found a number with a fraction"},
      {R"({"op":"states","userInfo":[]})", "\"userInfo\" of states: expected an object, found an array"},
      {R"({"op":"sleep"})", "no \"ms\" in sleep: expected an integer from 0 to 3600000"},
      {R"({"op":"sleep","ms":true})",
       "\"ms\" of sleep: expected an integer from 0 to 3600000, found a boolean"},
      {R"({"op":"sleep","ms":-1})", "expected an integer from 0 to 3600000, found -1"},
      {R"({"op":"sleep","ms":3600001})", "expected an integer from 0 to 3600000, found 3600001"},
      {R"({"op":"sleep","ms":18446744073709551615})", "found 18446744073709551615"},
      {R"({"op":"send","payload":{"a":[{"b\u0000c":1}]}})", "a key holds a NUL character"},
      {R"({"op":"flush"})" + std::string(kLongestLine, ' '),
       "the line is too long: expected at most 1048576 bytes"},
  };
  for (const auto& c : cases) {
    const std::string shown = c.line.substr(0, 60);
    const auto line = parseSessionLine(c.line);
    ASSERT_FALSE(line.ok()) << shown;
    EXPECT_THAT(line.error(), HasSubstr(c.description)) << shown;
    EXPECT_EQ(line.error().find('\n'), std::string::npos) << shown;
  }
}

TEST(SessionLines, skipsBlankLines) {
  EXPECT_TRUE(isBlankLine(""));
  EXPECT_TRUE(isBlankLine(" \t\r"));
  EXPECT_FALSE(isBlankLine(" x"));
}

}  // namespace
}  // namespace veltrad::ctl
