// SPDX-License-Identifier: Apache-2.0
// Routing by a request's head, and the conversion of datagrams.
#include <fmt/format.h>
#include <gmock/gmock.h>

#include <atomic>

#include "base/property_list.h"
#include "fakes/scarce_memory.h"
#include "formats/json.h"
#include "gateway/buffered_body.h"
#include "gateway/datagram_receiver.h"
#include "gateway/request_router.h"
#include "gateway/table_rows.h"
#include "support/gzip.h"

namespace veltrad::gateway {
namespace {

struct FakeHead final : RequestHead {
  std::string verb = "POST", where;
  std::map<std::string, std::string> fields;
  std::optional<std::uint64_t> bytes;

  std::string_view method() const override { return verb; }
  std::string_view target() const override { return where; }
  std::string_view field(std::string_view name) const override {
    const auto found = fields.find(std::string(name));
    return found == fields.end() ? std::string_view() : found->second;
  }
  std::optional<std::uint64_t> length() const override { return bytes; }
};

FakeHead head(std::string target, std::map<std::string, std::string> fields = {}) {
  FakeHead made;
  made.where = std::move(target);
  made.fields = std::move(fields);
  return made;
}

int statusOf(const FakeHead& head) {
  const auto wanted = parsedRequest(head, BodyBounds());
  return wanted ? 200 : wanted.error().status;
}

TEST(RequestRouter, DecidesFromTheHead) {
  const std::map<std::string, std::string> gzip{{"Content-Encoding", "gzip"}};
  FakeHead get = head("/events"), large = head("/events"), atBound = head("/events");
  get.verb = "GET";
  large.bytes = (16u << 20) + 1;
  atBound.bytes = 16u << 20;
  const std::pair<FakeHead, int> rows[] = {
      {head("/events"), 200},
      {head("/events?x=1"), 200},
      {head("/events/v-42"), 200},
      {head("/events/" + std::string(32, 'a')), 200},
      {head("/events/" + std::string(33, 'a')), 404},
      {head("/events/"), 404},
      {head("/events/A"), 404},
      {head("/events/a/b"), 404},
      {head("/eventsx"), 404},
      {head("/"), 404},
      {get, 405},
      {atBound, 200},
      {large, 413},
      {head("/events", {{"Content-Type", "application/json; charset=utf-8"}}), 200},
      {head("/events", {{"Content-Type", "text/plain"}}), 415},
      {head("/events", {{"Content-Encoding", "br"}}), 415},
      {head("/logdata", gzip), 200},
      {head("/upload?uuid=u&sequence=42&filename=a%20b.gz", gzip), 200},
      {head("/upload?uuid=u&sequence=42&filename=a", {}), 415},
      {head("/upload?uuid=u", gzip), 400},
      {head("/upload?sequence=4294967296", gzip), 400},
      {head("/upload?sequence=1&filename=%ff", gzip), 400},
      {head("/upload?sequence=1&filename=%2", gzip), 400},
      {head("/upload?sequence=1&filename=%00", gzip), 400},
      {head("/upload?sequence=1&filename=" + std::string(1'025, 'a'), gzip), 400},
  };
  for (const auto& [request, status] : rows) EXPECT_EQ(statusOf(request), status) << request.where;
}

TEST(RequestRouter, ReadsWhatTheRequestSays) {
  const std::string id(32, 'a');
  const auto events = parsedRequest(head("/events/v42?x", {{"X-VLT-Post-ID", id}}), BodyBounds());
  EXPECT_EQ(events.value().via, "v42");
  EXPECT_EQ(events.value().postID, id);
  EXPECT_EQ(parsedRequest(head("/events", {{"X-VLT-Post-ID", "A" + id}}), BodyBounds()).value().postID, "");
  const auto file =
      parsedRequest(head("/upload?uuid=&sequence=7&description=Callwyn%20QBSL&filename=a%20b.gz&raw=true",
                         {{"Content-Encoding", "gzip"}}),
                    BodyBounds());
  EXPECT_EQ(file.value().query.at("filename"), "a b.gz");
  EXPECT_EQ(file.value().query.at("description"), "Callwyn QBSL");
}

// A router whose stream cannot be reached, with little room.
class Room : public testing::Test {
 protected:
  static constexpr std::size_t kHeldBytes = 2u << 20;

  Room()
      : publisher(Publisher::open(unreachable(), {.bytes = kHeldBytes}, metrics).value()),
        router(*publisher, metrics,
               {.logData = 100'000,
                .eventsInOne = 4'096,
                .eventsTogether = 100u << 10,
                .othersTogether = 4u << 20},
               429, [](const std::function<void()>& work) { work(); }) {}
  // No completion comes after what it uses.
  ~Room() override { publisher.reset(); }

  static StreamOptions unreachable() {
    StreamOptions options;
    options.servers = {"nats://127.0.0.1:1"};
    return options;
  }
  // The handler, or nothing: refused with 429.
  BodyHandler* open(const FakeHead& head) {
    auto handled = router.request(head);
    if (auto* refusal = std::get_if<Answer>(&handled)) {
      EXPECT_EQ(refusal->status, 429);
      return nullptr;
    }
    handlers.push_back(std::move(std::get<std::unique_ptr<BodyHandler>>(handled)));
    return handlers.back().get();
  }
  // The status of the refusal; 0: the whole is held.
  static int post(BodyHandler& handler, std::string_view body) {
    while (!body.empty()) {
      if (const auto refusal = handler.take(body)) return refusal->status;
    }
    const auto isDone = std::make_shared<bool>(false);
    handler.finish([isDone] { *isDone = true; });
    return *isDone ? handler.answer().status : 0;
  }

  Metrics metrics;
  std::unique_ptr<Publisher> publisher;
  RequestRouter router;
  // Those of messages that are held must stay.
  std::vector<std::unique_ptr<BodyHandler>> handlers;
  const FakeHead upload = head("/upload?sequence=1", {{"Content-Encoding", "gzip"}});
};

TEST_F(Room, OfEventsIsNotTakenByFiles) {
  ASSERT_TRUE(open(upload));
  EXPECT_FALSE(open(upload));
  FakeHead small = upload;
  small.bytes = 1'000;
  EXPECT_TRUE(open(small)) << "what it can keep at most is known";
  EXPECT_TRUE(open(head("/events")));
  handlers.clear();
  EXPECT_TRUE(open(upload));
}

TEST_F(Room, IsTakenByWhatABodyKeeps) {
  const std::string start = R"({"clientId":"c","events":[]})";
  BodyHandler *const first = open(head("/events")), *const second = open(head("/events"));
  EXPECT_EQ(post(*first, start + std::string(40'000, ' ')), 0);
  EXPECT_EQ(post(*second, start + std::string(40'000, ' ') + "\n"), 429);
  EXPECT_FALSE(open(head("/events", {{"Content-Encoding", "gzip"}})))
      << "the first is held still, and zlib needs more than is left";
  EXPECT_EQ(publisher->held(), 1u);
}

TEST_F(Room, IsGivenBackByABodyThatBecomesAMessage) {
  Refusals refusals(*publisher, metrics, 429);
  const HandlerServices services{*publisher, metrics, refusals, {}, {}};
  ByteBudget budget(1'000'000);
  BufferedBody body(services, Charge(budget), false, 900'000);
  const std::string text(900'000, 'x');
  std::string_view bytes = text;
  EXPECT_FALSE(body.add(bytes));
  Charge other(budget);
  EXPECT_FALSE(other.to(200'000));
  EXPECT_TRUE(body.becomes(Message()));
  EXPECT_TRUE(other.to(200'000));
  EXPECT_LT(body.text().capacity(), 100u);
}

TEST_F(Room, OfLogDataIsTakenByTheirJSON) {
  for (const auto& [length, status] : {std::pair(16'000u, 0), {17'000u, 413}}) {
    const auto list = writeBinaryPropertyList(Array{std::string(length, '\x01')});
    EXPECT_EQ(post(*open(head("/logdata")), list), status) << length;
  }
}

TEST_F(Room, IsNotLeftToASmallBodyOfManyEvents) {
  std::string events = "{}";
  for (int i = 1; i < 4'096; ++i) events += ",{}";
  const std::string start = R"({"clientId":"c","events":[)";
  EXPECT_EQ(post(*open(head("/events")), start + events + "]}"), 0);
  EXPECT_EQ(post(*open(head("/events")), start + events + ",{}]}"), 400);
}

// Whatever finds no memory: a request is held, or ended once, or was not taken.
TEST_F(Room, OfMemoryIsFoundForAWholeRequest) {
  RequestRouter roomy(*publisher, metrics, {}, 429, [](const std::function<void()>& work) { work(); });
  const std::pair<const char*, std::string> rows[] = {
      {"/events", R"({"clientId":"c","events":[{"a":1}]})"},
      {"/logdata", writeBinaryPropertyList(Array{"a"})},
      {"/upload?sequence=1&uuid=u", *support::GzipCompressor().gzipDeflate({"content"}, 1)},
  };
  const auto ends = std::make_shared<std::atomic<int>>(0);
  int number = 0;
  for (const auto& [path, body] : rows) {
    forEachShortage([&, &path = path, &body = body](const auto& whenShort) {
      FakeHead request = head(path, {{"X-VLT-Post-ID", fmt::format("{:032x}", ++number)}});
      if (body.starts_with('\x1f')) request.fields["Content-Encoding"] = "gzip";
      handlers.emplace_back();
      const int before = *ends;
      const std::size_t held = publisher->held();
      bool isWhole = false;
      std::optional<Answer> refusal;
      whenShort([&] {
        auto handled = roomy.request(request);
        if (auto* handler = std::get_if<std::unique_ptr<BodyHandler>>(&handled))
          handlers.back() = std::move(*handler);
        std::string_view bytes = body;
        if (handlers.back()) refusal = handlers.back()->take(bytes);
        if (!handlers.back() || refusal) return;
        handlers.back()->finish([ends] { ++*ends; });
        isWhole = true;
      });
      EXPECT_EQ(publisher->held() - held + static_cast<std::size_t>(*ends - before), isWhole ? 1u : 0u)
          << path;
      if (*ends > before) EXPECT_EQ(handlers.back()->answer().status, 429);
    });
  }
  publisher.reset();
  EXPECT_GT(*ends, number / 6) << "each that was held ended with the publisher";
  handlers.clear();  // before the router
}

TEST_F(Room, EndsAFileOfWhichAPieceWasNotTaken) {
  std::string content;
  for (std::uint32_t number = 1; content.size() < 3 * kHeldBytes; number = number * 1'664'525 + 1'013'904'223)
    content += static_cast<char>(number >> 24);
  const std::string packed = *support::GzipCompressor().gzipDeflate({content}, 1);
  std::string_view rest = packed;
  BodyHandler* const handler = open(upload);
  std::optional<Answer> refusal;
  while (!refusal && !rest.empty()) {
    std::string_view piece = rest.substr(0, 10'000);
    rest.remove_prefix(piece.size());
    while (!refusal && !piece.empty()) refusal = handler->take(piece);
  }
  EXPECT_EQ(refusal.value_or(Answer()).status, 429);
  EXPECT_EQ(publisher->held(), 2u) << "of 960 KiB each";
}

TEST(Datagrams, BecomeTheSameMessageWheneverTheyAreSent) {
  // Version 2, component 6, kind 1, 123456 µs; 1400000000 s; session 4660, client 3; 20 bytes of text; 5/10;
  // number 7, reliable.
  std::string packet("\x02\x06\x01\x1e\x53\x72\x4e\x00\xff\xff\xed\xcb\xff\xfc\xff\xab\x00\x05\x00\x0a", 20);
  packet += std::string(40, 'd');
  packet += std::string("\x00\x07\x00\x01", 4);
  packet += " a=1 b=x\\=y c=z z d=";
  const Message message = messageOfDatagram(packet);
  EXPECT_EQ(message.id, messageOfDatagram(packet).id);
  EXPECT_NE(message.id, messageOfDatagram(packet + "x").id);
  const Value value = formats::parseJSON(message.body).value();
  const Dictionary& fields = *value.asDictionary();
  EXPECT_EQ(*fields.string("sender"), "FU");
  EXPECT_EQ(*fields.string("deviceID"), std::string(40, 'd'));
  EXPECT_EQ(fields.uint32("sessionID"), 4660u);
  EXPECT_EQ(fields.uint32("eventNumber"), 7u);
  EXPECT_EQ(fields.real("time"), 1400000000.12);
  EXPECT_EQ(*fields.dictionary("fields"), (Dictionary{{"a", "1"}, {"b", "x=y"}, {"c", "z z"}, {"d", ""}}));
}

TEST(Datagrams, StandInTheTableWhateverTheirItemsAreCalled) {
  std::string header("\x02\x06\x01\x1e\x53\x72\x4e\x00\xff\xff\xed\xcb\xff\xfc\xff\xab\x00\x05\x00\x0a", 20);
  header += std::string(40, 'd') + std::string("\x00\x07\x00\x01", 4);
  for (const char* item : {"$date=5", "$data=YQ==", "$date=", "a=1"}) {
    StreamMessage message;
    message.body = messageOfDatagram(header + " " + item).body;
    TableRows rows;
    ASSERT_TRUE(rows.addDatagram(message).ok()) << item;
    const std::string_view key(item, std::string_view(item).find('='));
    EXPECT_THAT(rows.datagrams, testing::HasSubstr("{\"" + std::string(key) + "\":\"")) << item;
  }
}

}  // namespace
}  // namespace veltrad::gateway
