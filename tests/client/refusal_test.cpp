// SPDX-License-Identifier: Apache-2.0
// A daemon that says nothing, and arguments that are refused before anything is sent.
#include "client/daemon_socket.h"
#include "harness.h"

namespace veltrad::client_test {
namespace {

TEST(Refusal, OfADaemonThatSaysNothingComesInTime) {
  FakeDaemon daemon([](auto&...) {}, "");
  const auto reached = client::reachDaemon(daemon.root.socketPath(), "", std::chrono::milliseconds(50));
  ASSERT_FALSE(reached);
  EXPECT_EQ(reached.error().status, VELTRA_NO_DAEMON);
  EXPECT_EQ(reached.error().text, "The daemon on " + daemon.root.socketPath() +
                                      " gave no answer within 0.05 s: see whether it is stuck or "
                                      "overloaded.");
}

TEST(Refusal, OfArgumentsSendsNothing) {
  FakeDaemon daemon(answerPlainly);
  Handle session = openHandle(daemon);
  const veltra::Dictionary large{{"k", veltra::Data{std::string(1u << 20, 'x')}}};
  const veltra::Value number{1};
  // Shares its parts, so that it costs little here and more than anybody can read when it is written out.
  veltra::Value shared = veltra::Array{};
  for (int i = 0; i < 40; ++i) shared = veltra::Array{shared, shared};
  const veltra::Dictionary blownUp{{"k", shared}};
  const auto send = [&](const veltra::Value& payload, std::uint32_t flag) {
    return veltra_session_send(session.get(), 1, 1, payload.get(), flag, nullptr, nullptr);
  };
  EXPECT_EQ(send(large, 0), VELTRA_TOO_LARGE);
  EXPECT_EQ(send(blownUp, 1), VELTRA_TOO_LARGE);
  EXPECT_EQ(send(number, 0), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_send_dictionary(session.get(), nullptr, nullptr, nullptr), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_states(session.get(), number.get(), nullptr, nullptr), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_upload_log_data_wait(session.get(), blownUp.get(), nullptr), VELTRA_INVALID);
  EXPECT_EQ(veltra_session_upload_log_data_wait(session.get(), shared.get(), nullptr), VELTRA_TOO_LARGE);
  EXPECT_EQ(veltra_session_send_dictionary_wait(session.get(), large.get(), nullptr), VELTRA_TOO_LARGE);
  veltra_session_options who{};
  EXPECT_EQ(veltra_session_send_one_shot_wait(session.get(), &who, 1, 1, nullptr, nullptr), VELTRA_INVALID);
  veltra_session_options_init(&who);
  who.user_info = large.get();
  EXPECT_EQ(veltra_session_send_one_shot(session.get(), &who, 1, 1, nullptr, nullptr, nullptr),
            VELTRA_TOO_LARGE);
  veltra_statistics counts;
  veltra_session_statistics(session.get(), &counts);
  EXPECT_EQ(counts.sent, 0u);
  EXPECT_FALSE(openHandle(daemon, VELTRA_TOO_LARGE, large.get()));
  EXPECT_FALSE(openHandle(daemon, VELTRA_INVALID, number.get()));
  veltra_status status{};
  EXPECT_FALSE(veltra_session_create(std::make_unique<veltra_session_options>().get(), &status, nullptr));
  EXPECT_EQ(status, VELTRA_INVALID);
}

}  // namespace
}  // namespace veltrad::client_test
