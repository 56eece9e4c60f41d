// The dashboard back end at its door: datagrams as a real socket receives them, and the lines that come back.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <filesystem>
#include <future>

#include "backends/dashboard/dashboard_backend.h"
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
class DashboardServer {
 public:
  explicit DashboardServer(std::uint16_t port = 0)
      : _socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const timeval patience{10, 0};
    ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    EXPECT_EQ(::bind(_socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    socklen_t size = sizeof address;
    ::getsockname(_socket.get(), reinterpret_cast<sockaddr*>(&address), &size);
    _port = ntohs(address.sin_port);
  }
  std::uint16_t port() const { return _port; }
  std::string receive() {
    char bytes[2048];
    socklen_t size = sizeof _client;
    const ssize_t length =
        ::recvfrom(_socket.get(), bytes, sizeof bytes, 0, reinterpret_cast<sockaddr*>(&_client), &size);
    return length < 0 ? "nothing came"s : std::string(bytes, static_cast<std::size_t>(length));
  }
  // To the sender of the last datagram of `heard`.
  void answer(const DashboardServer& heard, const std::string& bytes) {
    ::sendto(_socket.get(), bytes.data(), bytes.size(), 0, reinterpret_cast<const sockaddr*>(&heard._client),
             sizeof heard._client);
  }

 private:
  platform::FileDescriptor _socket;
  std::uint16_t _port = 0;
  sockaddr_in _client{};
};

class Dashboard : public ::testing::Test {
 protected:
  std::shared_ptr<VeltraBackend> make(const Dictionary& more = {}) {
    Dictionary profile{{"ip", "127.0.0.1"}, {"port", unsigned{server.port()}}};
    profile.merge(more);
    return configured(world.factory.newBackendWithName(kVeltraBackendDashboard, profile, "Desktop", 7));
  }
  std::shared_ptr<VeltraBackend> configured(std::shared_ptr<VeltraBackend> backend) {
    if (!backend) return nullptr;
    backend->setCompType(7);
    backend->setSessionID(4660);
    backend->setClientVersion(3);
    backend->setUdid(kDevice);
    backend->setSelfVersion("2.0");
    return backend;
  }
  void waitForCount(std::string_view reason, std::uint64_t least) {
    const auto deadline = std::chrono::steady_clock::now() + 10s;
    while (world.counters.value(reason) < least && std::chrono::steady_clock::now() < deadline)
      std::this_thread::yield();
    EXPECT_GE(world.counters.value(reason), least) << reason;
  }
  RecordedLog log;
  DashboardServer server;
  World world;
};

TEST_F(Dashboard, ThePacketToTheByteAndTheLineToTheBlank) {
  struct Case {
    bool profile;
    Dictionary more;
    std::string flags;
  };
  for (const Case& c : std::vector<Case>{
           {true, {{"reliable", 60'000}}, "\0\1"s}, {true, {}, "\0\0"s}, {false, {}, "\0\3"s}}) {
    const auto backend =
        c.profile
            ? make(c.more)
            : configured(DashboardBackend::initWithName(
                  BackendServices{world.http, world.clock, world.random, world.locale, world.preferences,
                                  world.counters, world.settings, world.device, world.library, world.pool},
                  "direct", "127.0.0.1"s, server.port(), "Desktop"));
    const Dictionary payload{{"codec", "opus with 18 chars"}};
    const auto line = static_cast<VeltraBackend&>(*backend).sendMessage(&payload, kTime, 1, 0, 5, 0);
    EXPECT_EQ(server.receive(), "\x02\x07\x01\x1E\x53\x72\x4E\x00\xFF\xFF\xED\xCB\xFF\xFC\xFF\xA6\0\1\0\0"s +
                                    kDevice + "\0\5"s + c.flags + " codec=opus with 18 chars");
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
    const std::string datagram = server.receive();
    EXPECT_EQ(datagram.substr(64), c.text);
    const auto inverted = static_cast<std::uint16_t>(~datagram.size());
    EXPECT_EQ(datagram.substr(14, 2), (std::string{char(inverted >> 8), char(inverted)}));
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
  const std::string datagram = server.receive();
  EXPECT_EQ(datagram.substr(14, 2), "\xFF\xBF");
  EXPECT_EQ(datagram.substr(20, 40), std::string(40, '\0'));
  EXPECT_EQ(datagram[3], '\xF9');
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
  waitForCount("datagram acknowledged", 1);
  EXPECT_EQ(world.counters.value("acknowledgement ignored: shorter than 62 bytes"), 1u);
  EXPECT_EQ(world.counters.value("acknowledgement ignored: no such datagram waits"), 1u);

  backend->cleanup();
  server.answer(server, second.substr(0, 62));
  log.expectLine(Level::debug, "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
  world.pool.drain(std::chrono::steady_clock::now() + 8s);  // the clean-up, not its last resort
  EXPECT_EQ(world.counters.value("datagram acknowledged"), 2u);
  backend->sendMessage(nullptr, kTime, 1, 3, 0);
  EXPECT_EQ(world.counters.value("datagram lost: its back end ended first"), 1u);
}

TEST_F(Dashboard, WhatARefusedPeerDidNotTakeComesWithTheNextTick) {
  auto gone = std::make_unique<DashboardServer>();
  const std::uint16_t port = gone->port();
  gone.reset();
  const auto backend = make({{"port", unsigned{port}}});
  backend->sendMessage(nullptr, kTime, 1, 1, 0);  // is what the peer refuses
  backend->sendMessage(nullptr, kTime, 1, 2, 0);
  EXPECT_EQ(world.counters.value("datagram held: the socket did not take it"), 1u);
  DashboardServer back(port);
  EXPECT_EQ(back.receive().substr(18, 2), "\0\2"s);
  waitForCount("datagram sent", 2);
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
  EXPECT_EQ(world.counters.value("datagram lost: its back end ended first"), 300u);
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

  log.expectLine(Level::error, "DashboardBackend(uploadLogData): Post URL for log data array is nil");
  EXPECT_FALSE(make()->uploadLogData(logData));
}

}  // namespace
}  // namespace veltrad
