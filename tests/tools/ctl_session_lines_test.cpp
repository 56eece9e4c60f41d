// What a line of `veltractl session` says, and what is wrong with one that says nothing.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "base/json.h"
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
  EXPECT_EQ(parseSessionLine(R"({"op":"restart","note":1})").value().operation, Operation::restart);
  EXPECT_FALSE(parseSessionLine(R"({"op":"states"})").value().userInfo);
  EXPECT_FALSE(parseSessionLine(R"({"op":"states","userInfo":null})").value().userInfo);
  EXPECT_EQ(parseSessionLine(R"({"op":"states","userInfo":{}})").value().userInfo, Dictionary());
  EXPECT_EQ(parseSessionLine(R"({"op":"states","userInfo":{"a":1}})").value().userInfo,
            Dictionary({{"a", 1}}));
  EXPECT_EQ(parseSessionLine(R"({"op":"sleep","ms":3600000})").value().duration, kLongestSleep);
  EXPECT_TRUE(isBlankLine("") && isBlankLine(" \t\r"));
  EXPECT_FALSE(isBlankLine(" x"));
}

TEST(SessionLines, saysWhatIsWrong) {
  const std::pair<std::string, const char*> cases[] = {
      {"hello", "not JSON: at byte 0: "},
      {R"({"op":"flush"} {})", "not JSON: at byte 15: "},
      {"[1]", "expected an object such as {\"op\":\"flush\"}, found an array"},
      {R"({"$date":1})", "found a date"},
      {"{}", "no \"op\": expected one of send, flush, states, displayURL, restart, sleep, finish"},
      {R"({"op":5})", "\"op\": expected a text, found an integer"},
      {R"({"op":"Send"})", "unknown op \"Send\": expected one of send,"},
      {R"({"op":"start"})", "unknown op \"start\""},
      {R"({"op":"send","payload":{"$data":"AAE="}})", "\"payload\" of send: expected an object, found data"},
      {R"({"op":"send","flag":"3"})", "\"flag\" of send: expected an integer, found a text"},
      {R"({"op":"send","flag":1.5})", "of send: expected an integer, found a number with a fraction"},
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
  for (const auto& [text, description] : cases) {
    const auto line = parseSessionLine(text);
    ASSERT_FALSE(line.ok()) << description;
    EXPECT_THAT(line.error(), testing::HasSubstr(description));
    EXPECT_EQ(line.error().find('\n'), std::string::npos) << description;
  }
}

}  // namespace
}  // namespace veltrad::ctl
