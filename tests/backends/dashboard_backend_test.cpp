// The dashboard back end at its door: datagrams as a real socket receives them, and the lines that come back.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <filesystem>
#include <future>

#include "backends/dashboard/dashboard_backend.h"
#include "backends/dashboard/log_data_uploads.h"
#include "base/property_list.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "platform/file_descriptor.h"
#include "protocol/constants.h"

namespace veltrad {
namespace {

using namespace std::chrono_literals;
using namespace std::string_literals;
using Level = platform::LogLevel;

const std::string kDevice = "00112233445566778899aabbccddeeff00112233";
constexpr platform::TimeValue kTime{1'400'000'000, 123'456};

// A dashboard on loopback. Whoever waits for a datagram in vain gets none after 10 s.
struct DashboardServer {
  explicit DashboardServer(std::uint16_t onPort = 0)
      : socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    auto address = *platform::parseIPv4Address("127.0.0.1", onPort);
    socklen_t size = sizeof address;
    const timeval patience{10, 0};
    ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    EXPECT_EQ(::bind(socket.get(), reinterpret_cast<sockaddr*>(&address), size), 0);
    ::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&address), &size);
    port = ntohs(address.sin_port);
  }
  std::string receive() {
    char bytes[2048];
    socklen_t size = sizeof client;
    const auto length =
        ::recvfrom(socket.get(), bytes, sizeof bytes, 0, reinterpret_cast<sockaddr*>(&client), &size);
    return length < 0 ? "nothing came"s : std::string(bytes, static_cast<std::size_t>(length));
  }
  // To the sender of the last datagram that `heard` received.
  void answer(const DashboardServer& heard, const std::string& bytes) {
    ::sendto(socket.get(), bytes.data(), bytes.size(), 0, reinterpret_cast<const sockaddr*>(&heard.client),
             sizeof client);
  }
  platform::FileDescriptor socket;
  std::uint16_t port = 0;
  sockaddr_in client{};
};

class Dashboard : public ::testing::Test {
 protected:
  std::shared_ptr<VeltraBackend> make(const Dictionary& more = {}) {
    Dictionary profile{{"ip", "127.0.0.1"}, {"port", unsigned{server.port}}};
    profile.merge(more);
    return configured(world.factory.newBackendWithName(kVeltraBackendDashboard, profile, "Desktop", 7));
  }
  std::shared_ptr<VeltraBackend> configured(std::shared_ptr<VeltraBackend> backend) {
    backend->setCompType(7);
    backend->setSessionID(4660);
    backend->setClientVersion(3);
    backend->setUdid(kDevice);
    backend->setSelfVersion("2.0");
    return backend;
  }
  RecordedLog log;
  DashboardServer server;
  World world;
};

TEST_F(Dashboard, ThePacketToTheByteAndTheLineToTheBlank) {
  LogDataUploads uploads(world.http);
  const auto direct =
      DashboardBackend::initWithName(world.services, uploads, "direct", "127.0.0.1"s, server.port, "Desktop");
  const std::pair<std::shared_ptr<VeltraBackend>, char> cases[] = {
      {make({{"reliable", 60'000}}), 1}, {make(), 0}, {configured(direct), 3}};
  const Dictionary payload{{"codec", "opus with 18 chars"}};
  for (const auto& [backend, flags] : cases) {
    const auto line = backend->sendMessage(&payload, kTime, 1, 0, 5, 0);
    EXPECT_EQ(server.receive(), "\x02\x07\x01\x1E\x53\x72\x4E\x00\xFF\xFF\xED\xCB\xFF\xFC\xFF\xA6\0\1\0\0"s +
                                    kDevice + "\0\5\0"s + flags + " codec=opus with 18 chars");
    EXPECT_EQ(line, "1400000000.120 " + kDevice +
                        " 127.0.0.1 JY     3  4660     5     1     0  codec=opus with 18 chars");
  }
}

TEST_F(Dashboard, ThePayloadBecomesText) {
  const auto backend = make();
  std::string longText(1'015, 'x');
  struct Case {
    Dictionary payload;
    std::string text;
    std::size_t lostByTheLine = 0;
  };
  for (const Case& c : std::vector<Case>{
           {{}, ""},
           {{{"list", Array{1}}, {"map", Dictionary{}}, {"date", Date{1}}}, " date=null list=null map=null"},
           {{{"text", ""}}, " text=empty"},
           {{{"text", "\n\n"}}, " text=empty"},
           {{{"text", "a=b\\c\n"}}, " text=a\\=b\\\\c"},
           {{{"k=\n", "v\nw"}}, " k=\n=vw"},
           {{{"b", "long value"}, {"a", 1}}, " a=1 b=long value"},
           {{{"a", "\xC3\xA9\xC3\xA9\xC3\xA9"}, {"b", "four"}}, " a=\xC3\xA9\xC3\xA9\xC3\xA9 b=four"},
           {{{"z", 10}, {"y", -3}, {"x", true}, {"w", 1.25}, {"v", 2.0}, {"u", ~0ull}},
            " v=2 x=1 y=-3 z=10 w=1.25 u=18446744073709551615"},
           {{{"text", "before\0after"s}, {"z", "another text"}}, " text=before z=another text"},
           {{{"key", longText + "=\xC3\xA9"}, {"z", longText + "later"}},
            " key=" + longText + "\\=\xC3",
            1}}) {
    const auto line = backend->sendMessage(&c.payload, kTime, 65'535, 0, 0);
    EXPECT_EQ(server.receive().substr(64), c.text);
    EXPECT_TRUE(line && line->ends_with(" 65535     0 " + c.text.substr(0, c.text.size() - c.lostByTheLine)));
  }
  EXPECT_EQ(world.counters.value("datagram cut: its text is longer than 1023 bytes"), 1u);
}

TEST_F(Dashboard, ADeviceWithoutIdentifierAndAnUnknownComponent) {
  const auto backend = make();
  backend->setUdid("");
  backend->setCompType(99);
  EXPECT_EQ(backend->sendMessage(nullptr, {7, 999'999}, 1, 2, 0),
            "7.996  127.0.0.1 (null)     3  4660     1     1     2 ");
  EXPECT_EQ(server.receive().substr(3, 57),
            "\xF9\0\0\0\x07\xFF\xFF\xED\xCB\xFF\xFC\xFF\xBF\0\1\0\2"s + std::string(40, '\0'));
}

TEST_F(Dashboard, AProfileThatNamesNoServerMakesNone) {
  const auto refused = [&](const Value& profile, const char* line) {
    log.expectLine(Level::error, "DashboardBackend(initWithName): "s + line);
    EXPECT_EQ(world.factory.newBackendWithName(kVeltraBackendDashboard, profile, "Desktop", 7), nullptr);
  };
  refused("text", "initWitName with all null params.");
  refused(Dictionary{{"port", 9}}, "can't resolve server IP");
  refused(Dictionary{{"ip", "127.0.0.1"}}, "can't resolve server port");
  for (const char* ip : {"localhost", "127.1", "::1", "127.0.0.1 ", "1000.000.000.001", ""}) {
    refused(Dictionary{{"ip", ip}, {"port", 9}}, "can't resolve server IP");
  }
  refused(Dictionary{{"ip", "255.255.255.255"}, {"port", 9}}, "socket connect() failed.");
}

TEST_F(Dashboard, AnAcknowledgementEndsRetransmission) {
  const auto backend = make({{"reliable", 100}, {"display_url", "https://d.example/"}});
  EXPECT_EQ(backend->displayURL(), "https://d.example/");
  backend->sendMessage(nullptr, kTime, 1, 1, 0);
  backend->sendMessage(nullptr, kTime, 1, 2, 0);
  const std::string first = server.receive();
  const std::string second = server.receive();
  EXPECT_EQ(server.receive(), first);  // again, and again in order
  EXPECT_EQ(server.receive(), second);

  DashboardServer stranger;
  stranger.answer(server, first);
  std::string unknown = first;
  unknown[60] = '\x77';
  for (const std::string& bytes : {""s, first.substr(0, 61), unknown, first}) server.answer(server, bytes);
  const auto deadline = std::chrono::steady_clock::now() + 10s;
  while (world.counters.value("datagram acknowledged") < 1 && std::chrono::steady_clock::now() < deadline)
    std::this_thread::yield();
  EXPECT_EQ(world.counters.value("acknowledgement ignored: shorter than 62 bytes"), 1u);
  EXPECT_EQ(world.counters.value("acknowledgement ignored: no such datagram waits"), 1u);

  backend->cleanup();
  server.answer(server, second.substr(0, 62));
  log.expectLine(Level::debug, "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
  world.pool.drain(std::chrono::steady_clock::now() + 8s);  // the clean-up, not its last resort
  EXPECT_EQ(world.counters.value("datagram acknowledged"), 2u);
  backend->sendMessage(nullptr, kTime, 1, 3, 0);
  EXPECT_EQ(world.counters.value("datagram lost: its back end ended before it was sent"), 1u);
}

TEST_F(Dashboard, WhatARefusedPeerDidNotTakeComesWithTheNextTick) {
  auto gone = std::make_unique<DashboardServer>();
  const std::uint16_t port = gone->port;
  gone.reset();
  const auto backend = make({{"port", unsigned{port}}});
  backend->sendMessage(nullptr, kTime, 1, 1, 0);  // is what the peer refuses
  backend->sendMessage(nullptr, kTime, 1, 2, 0);
  EXPECT_EQ(world.counters.value("datagram held: the socket did not take it"), 1u);
  DashboardServer back(port);
  EXPECT_EQ(back.receive().substr(18, 2), "\0\2"s);
}

TEST_F(Dashboard, ManyBackEndsShareTwoThreadsAndTheEndCountsWhatWaits) {
  const auto threads = [] {
    const std::filesystem::directory_iterator tasks("/proc/self/task");
    return std::distance(begin(tasks), end(tasks));
  };
  const auto before = threads();
  for (int i = 0; i < 300; ++i) {
    const auto backend = make({{"reliable", 60'000}});
    backend->sendMessage(nullptr, kTime, 1, 1, 0);
    backend->cleanup();
  }
  EXPECT_EQ(threads(), before + 2);
  world.pool.drain(std::chrono::steady_clock::now());
  world.pool.discard();
  EXPECT_EQ(world.counters.value("datagram given up: not acknowledged before its back end ended"), 300u);
}

TEST_F(Dashboard, LogDataIsPostedAndItsPlaceAnnounced) {
  const auto backend = make({{"post_url", "https://l.example/logs"}});
  const Array logData{Dictionary{{"line", 1}}, "two"};
  const auto upload = [&](platform::HTTPResult answer) {
    auto uploaded = std::async(std::launch::async, [&] { return backend->uploadLogData(logData); });
    const auto held = world.http.waitForRequest();
    EXPECT_EQ(held->request.method, platform::HTTPRequest::Method::post);
    EXPECT_EQ(held->request.url, "https://l.example/logs");
    EXPECT_EQ(held->request.headers, (platform::HTTPHeaders{{"Content-Type", "application/octet-stream"}}));
    const auto archive = parseBinaryPropertyList(held->request.body);
    EXPECT_TRUE(archive.ok() && archive.value() == Value(logData));
    world.http.answer(held, std::move(answer));
    return uploaded.get();
  };
  log.expectLine(Level::error, "DashboardBackend(uploadLogData): Error uploading log data array ()");
  EXPECT_FALSE(upload(FakeHTTPClient::response(200)));
  log.expectLine(Level::error, "DashboardBackend(uploadLogData): Error uploading log data array (no route)");
  EXPECT_FALSE(upload(FakeHTTPClient::error(platform::HTTPError::Kind::transport, "no route")));
  EXPECT_TRUE(upload(FakeHTTPClient::response(500, "/logs/123")));
  const std::string datagram = server.receive();  // the first one of this back end
  EXPECT_EQ(datagram.substr(16, 4) + datagram.substr(60),
            "\0\0\0\2\0\1\0\0 LogDataUploadLocation=/logs/123"s);

  const Array large{std::string(LogDataUploads::kMostBytes / 2, 'x')};
  auto first = std::async(std::launch::async, [&] { return backend->uploadLogData(large); });
  EXPECT_TRUE(world.http.waitForRequest());
  log.expectLine(Level::error, "array (Too many log data uploads under way)");
  EXPECT_FALSE(make({{"post_url", "https://l.example/"}})->uploadLogData(large));
  EXPECT_TRUE(world.http.answerNext(FakeHTTPClient::response(200, "/logs/124")) && first.get());

  log.expectLine(Level::error, "DashboardBackend(uploadLogData): Post URL for log data array is nil");
  EXPECT_FALSE(make()->uploadLogData(logData));
}

}  // namespace
}  // namespace veltrad
