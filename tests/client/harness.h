// SPDX-License-Identifier: Apache-2.0
// A daemon's end of the wire for the library's tests: a real socket under a root of its own, and for each
// client a thread that answers its calls as the test says.
#pragma once

#include <gmock/gmock.h>

#include <atomic>
#include <functional>
#include <list>
#include <memory>

#include "fakes/wire.h"
#include "veltra/veltra.hpp"

namespace veltrad::client_test {

using ::testing::ElementsAre;

class FakeDaemon {
 public:
  // Runs for each call, the one that describes the session first, on the client's thread here.
  using Handler = std::function<void(WireEnd&, const Received&)>;

  // Says `greeting` in answer to a hello.
  explicit FakeDaemon(Handler handler,
                      std::string greeting = wire::makeFrame(wire::FrameKind::hello, 0, {{"wire", 1}}))
      : _handler(std::move(handler)),
        _greeting(std::move(greeting)),
        _listener(unixSocket(::bind, root.socketPath())) {
    EXPECT_EQ(::listen(_listener.get(), 64), 0);
    _accepting = std::thread([this] { accept(); });
  }
  ~FakeDaemon() {
    ::shutdown(_listener.get(), SHUT_RDWR);
    _accepting.join();
    for (WireEnd& link : _links) link.hangUp();
    for (std::thread& thread : _threads) thread.join();
  }
  const TemporaryRoot root;

 private:
  void accept() {
    for (;;) {
      FileDescriptor socket(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
      if (!socket.isOpen()) return;
      WireEnd& link = _links.emplace_back(std::move(socket));
      _threads.emplace_back([this, &link] { serve(link); });
    }
  }
  void serve(WireEnd& link) {
    EXPECT_EQ(link.next().body.uint32("wire"), wire::kWireVersion);
    link.send(_greeting);
    while (const auto call = link.receive()) _handler(link, *call);
    link.hangUp();
  }

  const Handler _handler;
  const std::string _greeting;
  const FileDescriptor _listener;
  std::thread _accepting;
  std::list<WireEnd> _links;  // the accepting thread's until it has ended
  std::vector<std::thread> _threads;
};

inline std::string replyFrame(std::uint32_t callID, Dictionary results) {
  return wire::makeFrame(wire::FrameKind::reply, callID, {{"results", std::move(results)}});
}

// Answers a message with "CATEGORY/TYPE", another call with its name, each with two backends besides.
inline void answerPlainly(WireEnd& link, const Received& call) {
  if (call.callID == 0) return;
  const Dictionary args = call.args();
  const std::string text =
      call.op() == operation::kSendMessage
          ? std::to_string(*args.uint16("category")) + "/" + std::to_string(*args.uint16("type"))
          : call.op();
  link.send(replyFrame(call.callID, {{"reply", text}, {"backends", Array{"dashboard", "httppost"}}}));
}

inline veltra::Session open(const FakeDaemon& daemon, std::size_t queueBytes = 0) {
  veltra::Session session{{.root = daemon.root.directory(), .queueBytes = queueBytes}};
  EXPECT_TRUE(session) << session.error().description;
  return session;
}

using Handle = std::unique_ptr<veltra_session, decltype(&veltra_session_close)>;
inline Handle openHandle(const FakeDaemon& daemon, veltra_status expected = VELTRA_OK,
                         const veltra_value* userInfo = nullptr) {
  const std::string root = daemon.root.directory();
  veltra_session_options options;
  veltra_session_options_init(&options);
  options.root = root.c_str();
  options.user_info = userInfo;
  veltra_status status{};
  Handle handle(veltra_session_create(&options, &status, nullptr), veltra_session_close);
  EXPECT_EQ(status, expected);
  return handle;
}

inline std::string textOf(const veltra::Reply& reply) {
  return reply.text.value_or(reply.error ? reply.error->description : "(none)");
}
inline constexpr const char* kEnded = "The connection to the daemon ended before the answer came.";

}  // namespace veltrad::client_test
