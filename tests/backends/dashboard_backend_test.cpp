// SPDX-License-Identifier: Apache-2.0
// The dashboard back end at its door: datagrams as a real socket receives them, and the lines that come back.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <filesystem>

#include "backends/dashboard/dashboard_backend.h"
#include "backends/dashboard/dashboard_queues.h"
#include "backends/dashboard/log_data_uploads.h"
#include "base/file_descriptor.h"
#include "fakes/few_descriptors.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "platform/memory_budget.h"
#include "wire/constants.h"

namespace veltrad {
namespace {

using namespace std::string_literals;
using Level = platform::LogLevel;

const std::string kDevice = "00112233445566778899aabbccddeeff00112233";
constexpr platform::TimeValue kTime{1'400'000'000, 123'456};

// A dashboard on loopback. A wait for a datagram ends without one after 10 s.
struct DashboardServer {
  DashboardServer() : socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    auto address = *backends::parseIPv4Address("127.0.0.1", 0);
    socklen_t size = sizeof address;
    const timeval patience{10, 0};
    ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
    EXPECT_EQ(::bind(socket.get(), reinterpret_cast<sockaddr*>(&address), size), 0);
    ::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&address), &size);
    port = ntohs(address.sin_port);
  }
  std::string receive() {
    char bytes[2048];
    const auto length = ::recv(socket.get(), bytes, sizeof bytes, 0);
    return length < 0 ? "nothing came"s : std::string(bytes, static_cast<std::size_t>(length));
  }
  FileDescriptor socket;
  std::uint16_t port = 0;
};

backends::SharedProfile parsed(const Dictionary& profile) {
  return config::parseSection({{"dashboard", profile}})->backends.at("dashboard");
}

class Dashboard : public ::testing::Test {
 protected:
  std::shared_ptr<backends::VeltraBackend> make(const Dictionary& more = {},
                                                std::shared_ptr<platform::MemoryAccount> account = nullptr) {
    Dictionary profile{{"ip", "127.0.0.1"}, {"port", unsigned{server.port}}};
    profile.merge(more);
    backends::SessionFacts facts;
    facts.account = std::move(account);
    return configured(
        world.factory.newBackendWithName(wire::kVeltraBackendDashboard, parsed(profile), "Desktop",
                                         std::make_shared<const backends::SessionFacts>(std::move(facts))));
  }
  // A message that nobody acknowledges, and the end of its back end.
  void sendAndEnd(std::shared_ptr<platform::MemoryAccount> account) {
    const auto backend = make({{"reliable", 60'000}}, std::move(account));
    backend->sendMessage(std::nullopt, kTime, 1, 1, 0);
    backend->cleanup();
  }
  static std::ptrdiff_t entries(const char* directory) {
    const std::filesystem::directory_iterator all(directory);
    return std::distance(begin(all), end(all));
  }
  std::shared_ptr<backends::VeltraBackend> configured(std::shared_ptr<backends::VeltraBackend> backend) {
    backends::SessionFacts facts;
    facts.compType = 7;
    facts.sessionID = 4660;
    facts.clientVersion = 3;
    facts.device.udid = kDevice;
    facts.selfVersion = {2, 0};
    backend->setFacts(std::make_shared<const backends::SessionFacts>(facts));
    return backend;
  }
  RecordedLog log;
  DashboardServer server;
  World world;
};

TEST_F(Dashboard, ThePacketToTheByteAndTheLineToTheBlank) {
  backends::LogDataUploads uploads(world.http, world.counters);
  const backends::DashboardMaking making{world.random,
                                         world.clock,
                                         world.counters,
                                         world.pool,
                                         uploads,
                                         std::make_shared<backends::DashboardQueues>(),
                                         {}};
  const auto direct =
      backends::DashboardBackend::initWithName(making, "direct", "127.0.0.1"s, server.port, "Desktop");
  const std::pair<std::shared_ptr<backends::VeltraBackend>, char> cases[] = {
      {make({{"reliable", 60'000}}), 1}, {make(), 0}, {configured(direct), 3}};
  const Dictionary payload{{"codec", "opus with 18 chars"}};
  for (const auto& [backend, flags] : cases) {
    const auto [decision, line] = backend->sendNumberedMessage({payload, kTime, 1, 0, 5, 0});
    EXPECT_EQ(decision.fate, (flags & 1) ? wire::Fate::waiting : wire::Fate::sent);
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
    const auto line = backend->sendMessage(c.payload, kTime, 65'535, 0, 0).text;
    EXPECT_EQ(server.receive().substr(64), c.text);
    EXPECT_TRUE(line && line->ends_with(" 65535     0 " + c.text.substr(0, c.text.size() - c.lostByTheLine)));
  }
  EXPECT_EQ(world.counters.value(wire::Reason::datagram_cut), 1u);
}

TEST_F(Dashboard, SoManyLingerOfAUserAndInAllAndTheOldestEnds) {
  platform::MemoryBudget budget;
  const auto threads = entries("/proc/self/task");
  const auto ended = wire::Reason::too_many_linger;
  sendAndEnd(nullptr);  // nobody's, and the oldest of all: ended last, for want of room in all
  const auto descriptors = entries("/proc/self/fd");
  for (int i = 0; i < 70; ++i) sendAndEnd(budget.accountOf(1));
  EXPECT_EQ(entries("/proc/self/task"), threads + 2);
  EXPECT_EQ(world.counters.value(ended), 6u);
  EXPECT_EQ(entries("/proc/self/fd"), descriptors + 64);
  EXPECT_GT(budget.used(), 64u * 8192);
  EXPECT_LT(budget.used(), 64u * 10'000);
  for (unsigned user = 2; user <= 5; ++user) {
    for (int i = 0; i < 50; ++i) sendAndEnd(budget.accountOf(user));
  }
  EXPECT_EQ(entries("/proc/self/fd"), descriptors + 255);
  EXPECT_EQ(world.counters.value(ended), 6u + 9);  // 1 + 64 + 4 * 50 = 265
  world.pool.drain(std::chrono::steady_clock::now());
  world.pool.discard();
  EXPECT_EQ(world.counters.value(wire::Reason::ended_before_acknowledgement), 256u);
  EXPECT_EQ(budget.used(), 0u);
}

TEST_F(Dashboard, LingeringOnesMakeRoomForADescriptorAndForMemory) {
  platform::MemoryBounds bounds;
  bounds.userKept = 30'000;
  platform::MemoryBudget budget(bounds);
  const auto account = budget.accountOf(1);
  for (int i = 0; i < 5; ++i) sendAndEnd(account);  // three fit
  EXPECT_EQ(world.counters.value(wire::Reason::no_memory_to_linger), 2u);
  const auto backend = make({{"reliable", 60'000}}, account);
  for (int i = 0; i < 20; ++i) backend->sendMessage(std::nullopt, kTime, 1, 1, 0);
  EXPECT_GT(world.counters.value(wire::Reason::no_memory_to_await), 5u);
  EXPECT_EQ(world.counters.value(wire::Reason::datagram_sent), 25u);

  const FewDescriptors none;
  std::vector<std::shared_ptr<backends::VeltraBackend>> made;
  for (int i = 0; i < 3; ++i) made.push_back(make({}, account));
  log.expectLine(Level::error, "DashboardBackend(initWithName): socket() failed (24)");
  const Dictionary profile{{"ip", "127.0.0.1"}, {"port", 9}};
  EXPECT_EQ(world.factory.newBackendWithName(wire::kVeltraBackendDashboard, parsed(profile), "Desktop",
                                             std::make_shared<const backends::SessionFacts>()),
            nullptr);
}

}  // namespace
}  // namespace veltrad
