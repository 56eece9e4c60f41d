// Every way in which a session cannot be made has one line that says what to do.
#include "client/daemon_socket.h"
#include "harness.h"

namespace veltrad::client_test {
namespace {

// @ in `expected` stands for the socket's path.
void expectRefusal(const platform::Root& root, veltra_status status, std::string expected) {
  veltra::Session session{{.root = root.directory()}};
  EXPECT_FALSE(session);
  EXPECT_EQ(session.error().status, status);
  if (const auto at = expected.find('@'); at != std::string::npos) expected.replace(at, 1, root.socketPath());
  EXPECT_EQ(session.error().description, expected);
  EXPECT_EQ(session.start().error().status, VELTRA_INVALID);
  EXPECT_EQ(session.send(1, 1).get().status, VELTRA_INVALID);
  EXPECT_EQ(session.flush([](const veltra::Reply&) { ADD_FAILURE(); }), VELTRA_INVALID);
  EXPECT_EQ(session.close(), 0u);
}

TEST(Refusal, NamesWhatStandsAtTheSocketsPlace) {
  const TemporaryRoot root;
  const std::string path = root.socketPath();
  expectRefusal(root, VELTRA_NO_DAEMON,
                "No daemon listens on @: start veltrad, or name its root with VELTRA_ROOT or --root.");
  unixSocket(::bind, path);
  expectRefusal(root, VELTRA_NO_DAEMON, "The daemon that made @ has ended: start veltrad again.");
  std::filesystem::remove(path);
  const auto datagrams = unixSocket(::bind, path, SOCK_DGRAM);
  expectRefusal(root, VELTRA_NO_DAEMON,
                "@ is a socket of another type, not the daemon's: remove it and start veltrad.");
  expectRefusal(platform::Root("/" + std::string(200, 'r')), VELTRA_INVALID,
                "The root is too long: the socket's path @ has 236 bytes, and at most 107 are possible; "
                "name a shorter root with VELTRA_ROOT or --root.");
}

TEST(Refusal, TellsWhatTheDaemonSaidInPlaceOfAHello) {
  const Dictionary error{{"domain", "d"}, {"code", -1}, {"description", "Not you."}};
  const char* stranger = "What listens on @ does not answer like veltrad: stop it and start veltrad.";
  const std::tuple<std::string, veltra_status, const char*> cases[] = {
      {ipc::makeFrame(FrameKind::refusal, 0, {{"error", error}}), VELTRA_REFUSED, "Not you."},
      {ipc::makeFrame(FrameKind::refusal, 0, {}), VELTRA_REFUSED,
       "The daemon on @ refused the connection and gave no reason."},
      {ipc::makeFrame(FrameKind::hello, 0, {{"wire", 2}}), VELTRA_REFUSED,
       "The daemon on @ speaks version 2 of the wire protocol and this library 1: install both from the same "
       "release."},
      {ipc::makeFrame(FrameKind::event, 0, {{"wire", 1}}), VELTRA_NO_DAEMON, stranger},
      {"HTTP/1.1 400 Bad Request\r\n\r\n", VELTRA_NO_DAEMON, stranger},
      {"", VELTRA_NO_DAEMON,
       "The daemon on @ ended the connection without a word: start veltrad again, or see its log."},
  };
  for (const auto& [greeting, status, text] : cases) {
    FakeDaemon daemon([](WireEnd& link, const Received&) { link.hangUp(); }, greeting);
    expectRefusal(daemon.root, status, text);
  }
}

TEST(Refusal, OfADaemonThatSaysNothingComesInTime) {
  FakeDaemon daemon([](auto&...) {}, "");
  const auto reached = reachDaemon(daemon.root.socketPath(), "", std::chrono::milliseconds(50));
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
