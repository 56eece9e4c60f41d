// Sessions against a scripted daemon: calls out and answers in, one after the other and many at once.
#include <algorithm>
#include <atomic>
#include <set>
#include <thread>

#include "protocol/constants.h"
#include "sessions.h"

namespace veltrad::test {
namespace {

using ::testing::ElementsAre;

TEST(Session, DescribesItselfThenStartsSendsAndFinishes) {
  std::mutex mutex;
  std::vector<ReceivedCall> calls;
  FakeDaemon daemon(answering([&](Link& link, const ReceivedCall& call) {
    {
      const std::lock_guard held(mutex);
      calls.push_back(call);
    }
    answerPlainly(link, call);
  }));
  {
    auto options = optionsFor(daemon.root());
    options.has_client_type = options.has_session_id = true;
    options.client_type = -3;
    options.session_id = 4'000'000'000u;
    options.batch_events = true;
    options.client_name = "pho\xffne";
    veltra_value* info = veltra_dictionary();
    veltra_dictionary_set(info, "build", veltra_signed(7));
    options.user_info = info;
    const SessionPointer session = open(options);
    veltra_release(info);

    auto reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_start_wait(session.get(), r); });
    const veltra_value* backends = veltra_reply_backends(reply.get());
    ASSERT_EQ(veltra_count(backends), 2u);
    EXPECT_STREQ(veltra_get_string(veltra_array_item(backends, 1), nullptr), "httppost");
    veltra_value* payload = veltra_dictionary();
    veltra_dictionary_set(payload, "codec", veltra_string("opus"));
    reply = waited(VELTRA_OK,
                   [&](auto r) { return veltra_session_send_wait(session.get(), 5, 65535, payload, 0, r); });
    EXPECT_EQ(textOf(reply.get()), "5/65535");
    EXPECT_EQ(veltra_session_send(session.get(), 1, 2, payload, 3, nullptr, nullptr), VELTRA_OK);
    veltra_release(payload);
    reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_display_url_wait(session.get(), r); });
    EXPECT_EQ(textOf(reply.get()), "URL not available");
    waited(VELTRA_OK, [&](auto r) { return veltra_session_finish_wait(session.get(), r); });
  }
  const std::lock_guard held(mutex);
  ASSERT_EQ(calls.size(), 6u);
  EXPECT_EQ(calls[0].op, "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:");
  EXPECT_EQ(calls[0].id, 0u);
  EXPECT_EQ(calls[0].args,
            (Dictionary{{"sessionInfo", Dictionary{{"batchEvent", true},
                                                   {"clientType", -3},
                                                   {"requireUserInfo", false},
                                                   {"sessionID", 4'000'000'000u}}},
                        {"userInfo", Dictionary{{"build", 7}, {"clientName", "pho\xEF\xBF\xBDne"}}},
                        {"hasAggregationBlock", false}}));
  EXPECT_EQ(calls[2].args,
            (Dictionary{{"category", 5}, {"type", 65535}, {"payload", Dictionary{{"codec", "opus"}}}}));
  EXPECT_EQ(calls[3].op, "sendMessageWithDictionary:reply:");
  EXPECT_EQ(calls[3].id, 0u);
  EXPECT_EQ(calls[3].args, (Dictionary{{"message", Dictionary{{"category", 1},
                                                              {"flag", 3},
                                                              {"payload", Dictionary{{"codec", "opus"}}},
                                                              {"type", 2}}}}));
  EXPECT_EQ(calls[5].op, "finishSessionWithReply:");
}

TEST(Session, CarriesCallsOutInTheOrderInWhichTheyWereMadeAndGivesEachItsOwnAnswer) {
  constexpr int kCalls = 600;
  constexpr std::size_t kAnswered = 400;
  std::vector<int> order;
  // Answers in pairs, the later one first; every third call asks for no answer.
  FakeDaemon daemon([&](Link& link) {
    if (!link.greet()) return;
    std::optional<ReceivedCall> kept;
    while (const auto call = link.nextCall()) {
      if (call->op != "sendMessageWithCategory:type:payload:reply:") continue;
      order.push_back(*call->args.uint16("type"));
      if (call->id == 0) continue;
      if (!kept) {
        kept = call;
        continue;
      }
      answerPlainly(link, *call);
      answerPlainly(link, *kept);
      kept.reset();
    }
  });
  SessionPointer session = open(daemon);
  std::vector<std::pair<int, std::string>> answers;
  struct Context {
    std::vector<std::pair<int, std::string>>* answers;
    int number;
    std::promise<void>* last;
  };
  std::promise<void> all;
  std::vector<Context> contexts;
  for (int i = 0; i < kCalls; ++i) contexts.push_back({&answers, i, &all});
  for (int i = 0; i < kCalls; ++i) {
    const auto callback = [](void* context, const veltra_reply* reply) {
      auto& mine = *static_cast<Context*>(context);
      mine.answers->emplace_back(mine.number, textOf(reply));
      if (mine.answers->size() == kAnswered) mine.last->set_value();
    };
    ASSERT_EQ(veltra_session_send(session.get(), 9, static_cast<uint16_t>(i), nullptr, 0,
                                  i % 3 == 0 ? nullptr : callback, &contexts[static_cast<std::size_t>(i)]),
              VELTRA_OK);
  }
  ASSERT_EQ(all.get_future().wait_for(std::chrono::seconds(20)), std::future_status::ready);
  veltra_statistics counts;
  veltra_session_statistics(session.get(), &counts);
  EXPECT_EQ(counts.sent, static_cast<uint64_t>(kCalls));
  EXPECT_EQ(counts.replies, kAnswered);
  EXPECT_EQ(counts.dropped + counts.queued + counts.unanswered, 0u);
  session.reset();
  ASSERT_EQ(answers.size(), kAnswered);
  for (const auto& [number, text] : answers) EXPECT_EQ(text, "9/" + std::to_string(number));
  EXPECT_EQ(answers[0].first, 2);
  EXPECT_EQ(answers[1].first, 1);
  ASSERT_EQ(order.size(), static_cast<std::size_t>(kCalls));
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST(Session, ServesThreadsThatWaitAndCallbacksAndEventsAtTheSameTime) {
  constexpr int kThreads = 6;
  constexpr int kRounds = 200;
  FakeDaemon daemon(answering([](Link& link, const ReceivedCall& call) {
    if (call.id != 0 && call.id % 5 == 0)
      link.event(Dictionary{{"category", 1}, {"type", 1}, {"timestamp", 2.5}});
    answerPlainly(link, call);
  }));
  auto options = optionsFor(daemon.root());
  std::atomic<int> events{0};
  options.aggregated_context = &events;
  options.aggregated = [](void* context, auto, auto, auto, auto, auto) {
    ++*static_cast<std::atomic<int>*>(context);
  };
  SessionPointer session = open(options);
  std::atomic<int> answered{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kRounds; ++i) {
        ASSERT_EQ(veltra_session_send(
                      session.get(), 1, 1, nullptr, 0,
                      [](void* context, const veltra_reply* reply) {
                        if (textOf(reply) == "1/1") ++*static_cast<std::atomic<int>*>(context);
                      },
                      &answered),
                  VELTRA_OK);
        const auto type = static_cast<uint16_t>(t * kRounds + i);
        const auto reply = waited(VELTRA_OK, [&](auto r) {
          return veltra_session_send_wait(session.get(), 2, type, nullptr, 0, r);
        });
        ASSERT_EQ(textOf(reply.get()), "2/" + std::to_string(type));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  veltra_statistics counts;
  veltra_session_statistics(session.get(), &counts);
  EXPECT_EQ(counts.sent, 2u * kThreads * kRounds);
  session.reset();
  EXPECT_EQ(answered, kThreads * kRounds);
  EXPECT_EQ(events, 2 * kThreads * kRounds / 5);
}

TEST(Session, WaitsWithoutItsThreadWhileACallbackTakesLong) {
  FakeDaemon daemon(answering(answerPlainly));
  SessionPointer session = open(daemon);
  Gate inside;
  Gate leave;
  struct Gates {
    Gate &inside, &leave;
  } gates{inside, leave};
  ASSERT_EQ(veltra_session_start(
                session.get(),
                [](void* context, const veltra_reply*) {
                  static_cast<Gates*>(context)->inside.open();
                  static_cast<Gates*>(context)->leave.wait();
                },
                &gates),
            VELTRA_OK);
  inside.wait();
  const auto reply =
      waited(VELTRA_OK, [&](auto r) { return veltra_session_send_wait(session.get(), 3, 4, nullptr, 0, r); });
  EXPECT_EQ(textOf(reply.get()), "3/4");
  leave.open();
  session.reset();  // before what its callback uses
}

TEST(Session, RefusesAWaitInsideACallback) {
  FakeDaemon daemon(answering(answerPlainly));
  SessionPointer session = open(daemon);
  struct Inside {
    veltra_session* session;
    std::promise<std::string> done;
  } inside{session.get(), {}};
  ASSERT_EQ(veltra_session_start(
                session.get(),
                [](void* context, const veltra_reply*) {
                  auto& mine = *static_cast<Inside*>(context);
                  veltra_reply* reply = nullptr;
                  EXPECT_EQ(veltra_session_flush_wait(mine.session, &reply), VELTRA_WOULD_DEADLOCK);
                  EXPECT_EQ(veltra_session_close(mine.session), 0u);
                  EXPECT_EQ(veltra_session_send(mine.session, 1, 1, nullptr, 0, nullptr, nullptr), VELTRA_OK);
                  mine.done.set_value(describe(reply));
                  veltra_reply_release(reply);
                },
                &inside),
            VELTRA_OK);
  EXPECT_EQ(inside.done.get_future().get(), "A waiting call inside a callback would wait for itself.");
  waited(VELTRA_OK, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
}

TEST(Session, ReadsAnswersOfEveryKind) {
  FakeDaemon daemon(answering([](Link& link, const ReceivedCall& call) {
    if (call.op == "fetchDisplayURL:") {
      link.reply(call.id, Dictionary{{"reply", "https://x/\xC3\xA9"}});
    } else if (call.op == "flushMessagesWithCompletion:") {
      link.reply(call.id,
                 Dictionary{{"reply", "half"},
                            {"error", Dictionary{{"domain", "d"}, {"code", -7}, {"description", "why"}}}});
    } else if (call.op == "startConfigWithCompletionHandler:") {
      link.reply(call.id, Dictionary{});
    } else if (call.op == "finishSessionWithReply:") {
      link.replyError(call.id, Dictionary{{"domain", kVeltraErrorDomain},
                                          {"code", -1},
                                          {"description", "The daemon gave no reply."}});
    } else if (call.op == "fetchStatesWithUserInfo:completionHandler:") {
      link.replyError(call.id, Dictionary{{"domain", "d"}, {"code", 400}, {"description", "No such call."}});
    } else if (call.id != 0) {
      link.send(ipc::makeFrame(ipc::FrameKind::reply, call.id, Dictionary{{"nothing", "known"}}));
    }
  }));
  SessionPointer session = open(daemon);
  auto reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_display_url_wait(session.get(), r); });
  EXPECT_EQ(textOf(reply.get()), "https://x/\xC3\xA9");
  EXPECT_EQ(veltra_reply_error_domain(reply.get()), nullptr);
  reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
  EXPECT_EQ(textOf(reply.get()), "half");
  EXPECT_STREQ(veltra_reply_error_domain(reply.get()), "d");
  EXPECT_EQ(veltra_reply_error_code(reply.get()), -7);
  EXPECT_EQ(describe(reply.get()), "why");
  reply = waited(VELTRA_OK, [&](auto r) { return veltra_session_start_wait(session.get(), r); });
  EXPECT_EQ(veltra_reply_backends(reply.get()), nullptr);
  reply = waited(VELTRA_NO_REPLY, [&](auto r) { return veltra_session_finish_wait(session.get(), r); });
  EXPECT_EQ(describe(reply.get()), "The daemon gave no reply.");
  reply =
      waited(VELTRA_REFUSED, [&](auto r) { return veltra_session_states_wait(session.get(), nullptr, r); });
  EXPECT_EQ(describe(reply.get()), "No such call.");
  EXPECT_EQ(veltra_reply_error_code(reply.get()), 400);
  reply = waited(VELTRA_NO_REPLY,
                 [&](auto r) { return veltra_session_send_wait(session.get(), 1, 1, nullptr, 0, r); });
  EXPECT_EQ(describe(reply.get()), "The daemon's reply could not be read.");
}

TEST(Session, RefusesWhatCannotBeSentAndSendsNothing) {
  FakeDaemon daemon(answering(answerPlainly));
  SessionPointer session = open(daemon);
  const auto made = [](veltra_value* value) {
    return std::unique_ptr<veltra_value, void (*)(veltra_value*)>(value,
                                                                  [](veltra_value* v) { veltra_release(v); });
  };
  const auto large = made(veltra_dictionary());
  const std::string bytes(1u << 20, 'x');
  veltra_dictionary_set(large.get(), "k", veltra_data(bytes.data(), bytes.size()));
  const auto number = made(veltra_signed(1));
  // Shares its parts, so that it costs little here and more than anybody can read when it is written out.
  veltra_value* shared = veltra_array();
  for (int i = 0; i < 40; ++i) {
    veltra_value* outer = veltra_array();
    veltra_array_append(outer, veltra_retain(shared));
    veltra_array_append(outer, shared);
    shared = outer;
  }
  const auto blownUp = made(veltra_dictionary());
  veltra_dictionary_set(blownUp.get(), "k", shared);

  veltra_session* s = session.get();
  EXPECT_EQ(veltra_session_send(s, 1, 1, large.get(), 0, nullptr, nullptr), VELTRA_TOO_LARGE);
  EXPECT_EQ(veltra_session_send(s, 1, 1, blownUp.get(), 1, nullptr, nullptr), VELTRA_TOO_LARGE);
  EXPECT_EQ(veltra_session_send(s, 1, 1, number.get(), 0, nullptr, nullptr), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_send_dictionary(s, nullptr, nullptr, nullptr), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_states(s, number.get(), nullptr, nullptr), VELTRA_INVALID);
  waited(VELTRA_TOO_LARGE, [&](auto r) { return veltra_session_send_dictionary_wait(s, large.get(), r); });
  waited(VELTRA_INVALID, [&](auto r) { return veltra_session_flush_wait(nullptr, r); });
  veltra_statistics counts;
  veltra_session_statistics(s, &counts);
  EXPECT_EQ(counts.sent, 0u);
  auto options = optionsFor(daemon.root());
  options.user_info = large.get();
  EXPECT_EQ(refused(options).status, VELTRA_TOO_LARGE);
  options.user_info = number.get();
  EXPECT_EQ(refused(options).status, VELTRA_INVALID);
}

TEST(Session, HandsAggregatedCopiesOverWhileThreadsWait) {
  FakeDaemon daemon(answering([](Link& link, const ReceivedCall& call) {
    if (call.op.starts_with("setSessionInfo")) EXPECT_EQ(call.args.boolean("hasAggregationBlock"), true);
    if (call.id == 0) return;
    // In one write with the answer, so that the waiting thread finds them.
    const Dictionary args{{"sessionInfo", Dictionary{{"sessionID", 8}}},
                          {"timestamp", 12.25},
                          {"category", 65535},
                          {"type", 2},
                          {"payload", Dictionary{{"k", Array{1, "two"}}}}};
    const auto event = [](Dictionary given) {
      return ipc::makeFrame(ipc::FrameKind::event, 0,
                            Dictionary{{"op", "sendMessageToClient:timestamp:category:type:payload:"},
                                       {"args", std::move(given)}});
    };
    link.send(event(args) +
              ipc::makeFrame(ipc::FrameKind::event, 0,
                             Dictionary{{"op", "somethingElse:"}, {"args", Dictionary{}}}) +
              event({{"timestamp", 0.0}, {"category", 0}, {"type", 0}}) +
              ipc::makeFrame(ipc::FrameKind::reply, call.id, Dictionary{{"results", Dictionary{}}}));
  }));
  auto options = optionsFor(daemon.root());
  Collected copies;
  options.aggregated_context = &copies;
  options.aggregated = [](void* context, const veltra_value* info, double timestamp, uint16_t category,
                          uint16_t type, const veltra_value* payload) {
    std::string text =
        std::to_string(timestamp) + " " + std::to_string(category) + " " + std::to_string(type);
    if (info) text += " " + std::to_string(veltra_get_unsigned(veltra_dictionary_item(info, "sessionID")));
    const veltra_value* second = veltra_array_item(veltra_dictionary_item(payload, "k"), 1);
    if (second) text += std::string(" ") + veltra_get_string(second, nullptr);
    static_cast<Collected*>(context)->add(text);
  };
  SessionPointer session = open(options);
  waited(VELTRA_OK, [&](auto r) { return veltra_session_flush_wait(session.get(), r); });
  EXPECT_THAT(copies.waitFor(2), ElementsAre("12.250000 65535 2 8 two", "0.000000 0 0"));
}

TEST(Session, LeavesNoDescriptorBehindAndNoneToOtherPrograms) {
  const auto descriptors = [] {
    std::set<int> numbers;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      const int number = std::stoi(entry.path().filename());
      if (::fcntl(number, F_GETFD) >= 0) numbers.insert(number);
    }
    return numbers;
  };
  FakeDaemon daemon([](Link& link) {
    if (link.greet()) (void)link.nextCall();
    while (link.nextCall()) continue;
  });
  const auto before = descriptors();
  SessionPointer session = open(daemon);
  for (const int number : descriptors()) {
    if (!before.contains(number)) EXPECT_TRUE(::fcntl(number, F_GETFD) & FD_CLOEXEC) << number;
  }
  session.reset();
  // The daemon's end stays until the daemon goes.
  EXPECT_LE(descriptors().size(), before.size() + 1);
}

}  // namespace
}  // namespace veltrad::test
