// SPDX-License-Identifier: Apache-2.0
// Which envelopes are accepted, and the columns of their events.
#include "gateway/envelope.h"

#include <gmock/gmock.h>

#include "base/text.h"
#include "formats/json.h"
#include "gateway/clean_json.h"
#include "gateway/table_rows.h"

namespace veltrad::gateway {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

std::string withEvent(const std::string& event) {
  return R"({"clientId":"c","postTime":1.5,"events":[)" + event + "]}";
}

TEST(Envelope, IsRefusedForWhatNoTableTakes) {
  const std::pair<std::string, const char*> rows[] = {
      {"", "no JSON"},
      {"[]", "object"},
      {R"({"events":[]})", "clientId"},
      {R"({"clientId":7,"events":[]})", "clientId"},
      {R"({"clientId":"c"})", "events"},
      {R"({"clientId":"c","events":{}})", "events"},
      {R"({"clientId":"c","events":[1]})", "event 0: it is no object"},
      {R"({"clientId":"c","events":[],"postTime":"now"})", "postTime"},
      {R"({"clientId":")" + std::string(1'025, 'c') + R"(","events":[]})", "1025 bytes"},
      {withEvent(R"({"a":{"b":1}})"), "nested"},
      {withEvent(R"({},{"a":[]})"), "event 1"},
      {withEvent(R"({"a":{"$date":5}})"), "nested"},
      {withEvent(R"({"a":1e999})"), "no JSON"},
      {withEvent("{\"a\":\"\xff\"}"), "UTF-8"},
      {withEvent(R"({")" + std::string(257, 'k') + R"(":1})"), "257 bytes"},
      {withEvent(R"({"_sessionID":")" + std::string(1'025, 's') + R"("})"), "_sessionID"},
      {withEvent("{}") + "x", "no JSON"},
  };
  for (const auto& [text, why] : rows) {
    const auto envelope = parseEnvelope(text);
    ASSERT_FALSE(envelope.ok()) << text;
    EXPECT_THAT(envelope.error(), HasSubstr(why)) << text;
  }
}

TEST(Envelope, HasABoundOfValues) {
  // What stands before counts for six.
  std::string text = R"({"clientId":"c","events":[],"more":[1)";
  for (std::size_t i = 6; i < kMostValues; ++i) text += ",1";
  EXPECT_TRUE(parseEnvelope(text + "]}").ok());
  EXPECT_THAT(parseEnvelope(text + ",1]}").error(), HasSubstr("more than 500000 values"));
}

TEST(Envelope, KeepsCharactersThatADatabaseTakes) {
  const std::pair<const char*, std::string> rows[] = {
      {R"(\u0000)", "\xef\xbf\xbd"},
      {R"(\ud83d\ude00)", "\xf0\x9f\x98\x80"},
      {R"(\ud83d)", "\xef\xbf\xbd"},
      {R"(\ude00\ud83d)", "\xef\xbf\xbd\xef\xbf\xbd"},
      {R"(\\u0000)", R"(\u0000)"},
      {R"(\\\u0000)", "\\\xef\xbf\xbd"},
      {R"(\ud83d\u0041)",
       "\xef\xbf\xbd"
       "A"},
  };
  for (const auto& [escaped, text] : rows) {
    const auto envelope = parseEnvelope(withEvent(std::string(R"({"a":")") + escaped + "\"}"));
    ASSERT_TRUE(envelope.ok()) << escaped << ": " << envelope.error();
    EXPECT_EQ(*envelope.value().events.at(0).string("a"), text) << escaped;
  }
}

EventColumns columnsIn(const char* event) {
  return columnsOf(parseEnvelope(withEvent(event)).value().events.at(0));
}

TEST(Envelope, FillsColumnsWithWhatTheyCanHold) {
  const EventColumns all = columnsIn(
      R"({"_sender":"FU","_sessionID":"A.B","_method":5,"_status":10,"_eventNumber":7,"eventTime":1400000000.5})");
  EXPECT_EQ(all.sender, "FU");
  EXPECT_EQ(all.sessionID, "A.B");
  EXPECT_THAT(all.sessionPath, ElementsAre("A", "B"));
  EXPECT_EQ(all.category, 5);
  EXPECT_EQ(all.type, 10);
  EXPECT_EQ(all.eventNumber, 7);
  EXPECT_EQ(all.happened, 1400000000.5);
  EXPECT_EQ(columnsIn(R"({"_sessionID":42})").sessionID, "42");

  const EventColumns none = columnsIn(R"({"_sender":1,"_sessionID":true,"_method":2.5,"_status":"1",)"
                                      R"("_eventNumber":4294967296,"eventTime":"soon"})");
  EXPECT_FALSE(none.sender || none.sessionID || none.category || none.type || none.eventNumber ||
               none.happened);
  const std::pair<double, bool> times[] = {{-1, false}, {0, true}, {4133980799.9, true}, {4133980800, false}};
  for (const auto& [time, fits] : times) EXPECT_EQ(columnTime(time).has_value(), fits) << time;
}

TEST(TableRows, AreWhatCopyReads) {
  TableRows rows;
  StreamMessage message;
  message.seq = 9;
  message.time = 1'400'000'000'123'456'789;
  message.via = "call";
  ASSERT_TRUE(rows.addEvents(message, withEvent(R"({"_sessionID":"a\\.\"b","t":"x\ty\\z\n"})")).ok());
  EXPECT_EQ(
      rows.events,
      "2014-05-13 "
      "16:53:20.123456+00\t9\t0\tc\t\\N\ta\\\\.\"b\t{\"a\\\\\\\\\",\"\\\\\"b\"}\t\\N\t\\N\t\\N\tcall\t\\N\t"
      "{\"_sessionID\":\"a\\\\\\\\.\\\\\"b\",\"t\":\"x\\\\ty\\\\\\\\z\\\\n\"}");
  EXPECT_THAT(rows.days, ElementsAre("2014-05-13"));
  message.body = std::string("a\0\xff", 3);
  rows.addRefused(message, "a\tb");
  EXPECT_EQ(rows.refused, "2014-05-13 16:53:20.123456+00\t9\ta\\tb\t\\\\x6100ff");
  rows.addRefused(message, "again");
  EXPECT_THAT(rows.refused, HasSubstr("6100ff\n2014-05-13"));
}

}  // namespace
}  // namespace veltrad::gateway
