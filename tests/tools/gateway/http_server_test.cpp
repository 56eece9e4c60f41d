// SPDX-License-Identifier: Apache-2.0
// Bodies over real connections: the limits for slow, endless and large ones.
#include "gateway/http_server.h"

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <sys/socket.h>

#include <future>

#include "base/file_descriptor.h"
#include "base/thread.h"
#include "fakes/scarce_memory.h"
#include "gateway/body_pace.h"

namespace veltrad::gateway {
namespace {

using namespace std::chrono_literals;
using testing::HasSubstr;
using testing::StartsWith;

// Answers with the number of its turns and of those that other bodies had meanwhile.
struct CountingHandler final : BodyHandler {
  CountingHandler(std::shared_future<void> begin, int& all) : begins(std::move(begin)), turnsOfAll(all) {}

  std::optional<Answer> take(std::string_view& bytes) override {
    begins.wait();
    bytes.remove_prefix(std::min<std::size_t>(bytes.size(), 10));
    ++turns;
    ++turnsOfAll;
    return std::nullopt;
  }
  bool hasRoom(std::function<void()>) override { return true; }
  void finish(std::function<void()> done) override { done(); }
  Answer answer() override {
    return {200, std::to_string(turns) + " " + std::to_string(turnsOfAll - turns), "", {}};
  }

  const std::shared_future<void> begins;
  int turns = 0;
  int& turnsOfAll;
};

class Server : public testing::Test {
 protected:
  Server()
      : server([this](const RequestHead& head) { return handle(head); }, {.stalled = 1s},
               [this] { ++shortages; }) {
    const std::string address = server.listen("127.0.0.1:0").value();
    port = static_cast<std::uint16_t>(std::stoi(address.substr(address.rfind(':') + 1)));
    EXPECT_TRUE(thread.start("http", 1u << 20, [this] { server.run(); }));
  }
  ~Server() override {
    server.end();
    thread.join();
  }

  std::variant<Answer, std::unique_ptr<BodyHandler>> handle(const RequestHead& head) {
    if (head.method() == "POST") return std::make_unique<CountingHandler>(begins, turns);
    if (scarce) failed = scarce->hasFailed();
    scarce.reset();
    if (head.method() == "GET") scarce.emplace(granted, true);
    return Answer{200, "made", "text/plain", {{"X-VLT-Long", std::string(100, 'x')}}};
  }

  FileDescriptor connected(std::string_view request) const {
    FileDescriptor link(::socket(AF_INET, SOCK_STREAM, 0));
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    to.sin_port = htons(port);
    const timeval longest{10, 0};
    ::setsockopt(link.get(), SOL_SOCKET, SO_RCVTIMEO, &longest, sizeof longest);
    EXPECT_EQ(::connect(link.get(), reinterpret_cast<sockaddr*>(&to), sizeof to), 0);
    EXPECT_TRUE(send(link, request));
    return link;
  }
  static bool send(const FileDescriptor& link, std::string_view bytes) {
    while (!bytes.empty()) {
      const ssize_t count = ::send(link.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }
  // What has come at once; empty: the connection is closed, or nothing came for ten seconds.
  static std::string received(const FileDescriptor& link) {
    char room[1'000];
    const ssize_t count = ::recv(link.get(), room, sizeof room, 0);
    return count > 0 ? std::string(room, static_cast<std::size_t>(count)) : "";
  }

  std::promise<void> begin;
  const std::shared_future<void> begins = begin.get_future();
  int turns = 0;
  // Of the server's thread, between a GET and a PUT.
  std::optional<ScarceMemory> scarce;
  std::atomic<std::size_t> granted{0};
  std::atomic<bool> failed{false};
  std::atomic<int> shortages{0};
  HTTPServer server;
  std::uint16_t port = 0;
  Thread thread;
};

constexpr const char* kHead = "POST / HTTP/1.1\r\nHost: h\r\n";

TEST_F(Server, LetsOthersHaveTheirTurnBetweenThoseOfALargeBody) {
  const std::string request = std::string(kHead) + "Content-Length: 10005\r\n\r\n" + std::string(10'005, 'x');
  const FileDescriptor first = connected(request), second = connected(request);
  begin.set_value();
  for (const FileDescriptor* link : {&first, &second}) {
    const std::string answer = received(*link);
    EXPECT_THAT(answer, StartsWith("HTTP/1.1 200"));
    int own = 0, others = 0;
    EXPECT_EQ(std::sscanf(answer.c_str() + answer.find("\r\n\r\n"), "%d %d", &own, &others), 2);
    EXPECT_GE(own, 1'001) << "of ten bytes each";
    EXPECT_GT(others, 500);
  }
  const std::string chunks = "19\r\n" + std::string(25, 'x') + "\r\n0\r\n\r\n";
  EXPECT_THAT(received(connected(std::string(kHead) + "Transfer-Encoding: chunked\r\n\r\n" + chunks)),
              HasSubstr("\r\n\r\n3 "));
}

TEST_F(Server, RefusesAChunkWhoseLineHasNoEnd) {
  const FileDescriptor link = connected(std::string(kHead) + "Transfer-Encoding: chunked\r\n\r\n1;");
  const std::string more(64u << 10, 'a');
  char first = 0;
  for (int i = 0; i < 1'000 && ::recv(link.get(), &first, 1, MSG_PEEK | MSG_DONTWAIT) <= 0; ++i)
    if (!send(link, more)) break;
  EXPECT_THAT(received(link), StartsWith("HTTP/1.1 400"));
}

TEST_F(Server, EndsABodyThatDripsForEver) {
  begin.set_value();
  const FileDescriptor link = connected(std::string(kHead) + "Content-Length: 1000\r\n\r\n");
  const auto started = std::chrono::steady_clock::now();
  const timeval between{0, 20'000};
  ::setsockopt(link.get(), SOL_SOCKET, SO_RCVTIMEO, &between, sizeof between);
  char nothing = 0;
  while (send(link, "x") && ::recv(link.get(), &nothing, 1, 0) < 0 && errno == EAGAIN)
    ASSERT_LT(std::chrono::steady_clock::now() - started, 10s);
  EXPECT_GE(std::chrono::steady_clock::now() - started, 900ms);
}

TEST_F(Server, OutlivesEachWantOfMemory) {
  begin.set_value();
  const auto asked = [this](const char* method) {
    return received(connected(method + std::string(" / HTTP/1.1\r\nHost: h\r\nContent-Length: 25\r\n\r\n") +
                              std::string(25, 'x')));
  };
  int refused = 0;
  do {
    failed = false;
    const int before = shortages;
    const bool told = !asked("GET").empty();
    const std::string answer = asked("POST");
    int tries = 0;
    while (asked("PUT").empty()) ASSERT_LT(++tries, 3) << granted;
    if (!told || answer.empty() || answer.find(" 503 ") != std::string::npos)
      EXPECT_GT(shortages, before) << granted;
    else
      EXPECT_THAT(answer, StartsWith("HTTP/1.1 200"));
    refused += answer.find("X-VLT-Refused: no_memory\r\n") != std::string::npos;
  } while (++granted, failed);
  if (granted > 1) EXPECT_GT(refused, 5);
}

TEST(BodyPace, EndsBodiesThatAreSlowForLong) {
  BodyPace pace(30s);
  const std::tuple<BodyPace::Duration, std::size_t, BodyPace::Duration> rows[] = {
      {10s, 0, 20s},        {5s, 4'096, 16s}, {0s, 1u << 20, 30s},
      {29s, 2'048, 1500ms}, {40s, 0, 0s},     {1s, 8'192, 2s},
  };
  for (const auto& [waited, bytes, left] : rows) {
    pace.passed(waited, bytes);
    EXPECT_EQ(pace.left(), left) << bytes;
  }
}

}  // namespace
}  // namespace veltrad::gateway
