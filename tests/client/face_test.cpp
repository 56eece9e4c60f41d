// The C++ face: what a program writes, and what arrives at the daemon.
#include <gmock/gmock.h>

#include "fake_daemon.h"
#include "veltra/veltra.hpp"

namespace veltrad::test {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Optional;

TEST(Face, CarriesAWholeConversation) {
  std::mutex mutex;
  std::vector<ReceivedCall> calls;
  FakeDaemon daemon(answering([&](Link& link, const ReceivedCall& call) {
    if (call.op == "sendMessageWithDictionary:reply:")
      link.event(Dictionary{{"timestamp", 1.5}, {"category", 3}});
    {
      const std::lock_guard held(mutex);
      calls.push_back(call);
    }
    answerPlainly(link, call);
  }));
  std::promise<double> aggregated;
  veltra::Session session{
      {.clientType = 7,
       .sessionID = 42,
       .clientName = "phone",
       .serviceName = "ringer",
       .userInfo = veltra::Dictionary{{"clientName", "overruled"}, {"build", 9u}},
       .batchEvents = true,
       .aggregated =
           [&](const veltra::Aggregated& copy) { aggregated.set_value(copy.timestamp + copy.category); },
       .root = daemon.root()}};
  ASSERT_TRUE(session) << session.error().description;
  const auto names = session.start();
  ASSERT_TRUE(names);
  EXPECT_THAT(*names, Optional(ElementsAre("dashboard", "httppost")));
  EXPECT_THAT(session.send(5, 1, {{"codec", "opus"}, {"seconds", 12.5}}).get().text,
              Optional(std::string("5/1")));
  EXPECT_EQ(session.post(5, 2), VELTRA_OK);
  std::promise<std::string> called;
  EXPECT_EQ(session.send(5, 3, {{"list", veltra::Array{1, "two", veltra::Dictionary{{"three", true}}}}},
                         [&](const veltra::Reply& reply) { called.set_value(reply.text.value_or("")); }),
            VELTRA_OK);
  EXPECT_EQ(called.get_future().get(), "5/3");
  EXPECT_TRUE(session.send({{"category", 5}, {"flag", 2}}).get());
  EXPECT_EQ(aggregated.get_future().get(), 4.5);
  EXPECT_TRUE(session.sendAndWait(5, 4, {{"when", veltra::Date{7}}, {"raw", veltra::Data{"\1\2"}}}));
  EXPECT_THAT(*session.displayURL(), Optional(std::string("URL not available")));
  EXPECT_TRUE(session.states(veltra::Dictionary{{"clientName", "phone"}}));
  EXPECT_TRUE(session.flush());
  EXPECT_TRUE(session.finish());
  veltra::Session moved = std::move(session);
  EXPECT_EQ(moved.statistics().replies, 9u);
  EXPECT_EQ(moved.close(), 0u);
  EXPECT_FALSE(moved);

  const std::lock_guard held(mutex);
  ASSERT_EQ(calls.size(), 11u);
  EXPECT_EQ(*calls[0].args.dictionary("userInfo"),
            (Dictionary{{"build", 9}, {"clientName", "phone"}, {"serviceName", "ringer"}}));
  EXPECT_EQ(*calls[2].args.dictionary("payload"), (Dictionary{{"codec", "opus"}, {"seconds", 12.5}}));
  EXPECT_EQ(calls[3].args.find("payload") ? calls[3].args.dictionary("payload")->size() : 0, 0u);
  EXPECT_EQ(*calls[4].args.dictionary("payload"),
            (Dictionary{{"list", Array{1, "two", Dictionary{{"three", true}}}}}));
  EXPECT_EQ(*calls[6].args.dictionary("payload"), (Dictionary{{"raw", Data{"\1\2"}}, {"when", Date{7}}}));
}

TEST(Face, ASessionThatCouldNotBeMadeSaysWhyAndRefusesEverything) {
  TemporaryRoot root;
  veltra::Session session{{.root = root.path()}};
  EXPECT_FALSE(session);
  EXPECT_EQ(session.error().status, VELTRA_NO_DAEMON);
  EXPECT_THAT(session.error().description, HasSubstr("No daemon listens on " + root.socketPath()));
  EXPECT_EQ(session.start().error().status, VELTRA_INVALID);
  EXPECT_EQ(session.send(1, 1).get().status, VELTRA_INVALID);
  EXPECT_EQ(session.flush([](const veltra::Reply&) { ADD_FAILURE(); }), VELTRA_INVALID);
  EXPECT_EQ(session.close(), 0u);
}

TEST(Face, AFutureEndsWithTheConnection) {
  FakeDaemon daemon([](Link& link) {
    if (!link.greet()) return;
    while (const auto call = link.nextCall()) {
      if (call->id != 0) return;
    }
  });
  veltra::Session session{{.root = daemon.root()}};
  const veltra::Reply reply = session.send(1, 1).get();
  EXPECT_EQ(reply.status, VELTRA_NO_REPLY);
  ASSERT_TRUE(reply.error);
  EXPECT_EQ(reply.error->domain, "com.florn.veltra.error");
  EXPECT_EQ(session.send(1, 1).get().status, VELTRA_NO_DAEMON);
}

}  // namespace
}  // namespace veltrad::test
