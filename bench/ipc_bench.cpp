// SPDX-License-Identifier: Apache-2.0
// Compares the round trip of a message and its reply through a connection of the daemon with two threads that
// exchange the same bytes over a bare socket. Prints nanoseconds and the ratio, with both ends on one core
// and with both on any core.
#include <fmt/format.h>
#include <sched.h>
#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <string>
#include <thread>
#include <vector>

#include "ipc/socket_connection.h"
#include "platform/file_store.h"
#include "wire/frame.h"
#include "wire/names.h"

namespace {

using namespace veltrad;
using Clock = std::chrono::steady_clock;

// With many short rounds, the best ones are not disturbed by other processes.
constexpr int kRounds = 400;
constexpr int kCallsARound = 200;

class EchoingSession final : public wire::ClientSessionInterface {
 public:
  bool setSessionInfo(wire::OptionalDictionary, wire::OptionalDictionary, std::optional<Array>,
                      bool) override {
    return true;
  }
  void startConfigWithCompletionHandler(wire::NamesReply) override {}
  void fetchStatesWithUserInfo(wire::OptionalDictionary, wire::NamesReply) override {}
  void fetchDisplayURL(wire::StringReply) override {}
  void sendMessageWithCategory(std::uint16_t, std::uint16_t, wire::OptionalDictionary,
                               wire::StringReply reply) override {
    if (reply) reply("queued");
  }
  void sendMessageWithDictionary(Dictionary, wire::StringReply) override {}
  void flushMessagesWithCompletion(wire::FlushReply reply) override {
    if (reply) reply(std::nullopt, std::nullopt);
  }
  void finishSessionWithReply(wire::StringReply) override {}
  void uploadFileAtPath(std::string, std::string, wire::BooleanReply) override {}
  void uploadLogData(Array, wire::UploadLogDataReply) override {}
  void sendMessageWithSessionInfo(wire::OptionalDictionary, wire::OptionalDictionary, std::uint16_t,
                                  std::uint16_t, wire::OptionalDictionary, wire::StringReply) override {}
  void end() override {}
  std::string description() const override { return "echoing session"; }
};

std::string callFrame(std::uint32_t id) {
  Dictionary payload;
  for (int i = 0; i < 8; ++i) payload.set(fmt::format("field{}", i), fmt::format("value number {}", i));
  payload.set("seconds", 12.5);
  payload.set("count", 42);
  Dictionary body{{wire::key::kOperation, wire::operation::kSendMessage}};
  body.set(wire::key::kArguments,
           Dictionary{
               {wire::key::kCategory, 5}, {wire::key::kType, 1}, {wire::key::kPayload, std::move(payload)}});
  return wire::makeFrame(wire::FrameKind::call, id, std::move(body));
}

void pinTo(int core) {
  cpu_set_t cores;
  CPU_ZERO(&cores);
  if (core >= 0) {
    CPU_SET(core, &cores);
  } else {
    for (unsigned i = 0; i < std::thread::hardware_concurrency(); ++i) CPU_SET(i, &cores);
  }
  ::sched_setaffinity(0, sizeof cores, &cores);  // inherited by threads that start later
}

bool sendAll(int socket, const std::string& bytes) {
  return ::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

bool receiveAll(int socket, std::size_t size) {
  char bytes[4096];
  while (size > 0) {
    const ssize_t count = ::recv(socket, bytes, std::min(size, sizeof bytes), 0);
    if (count <= 0) return false;
    size -= static_cast<std::size_t>(count);
  }
  return true;
}

// Nanoseconds per round trip, measured by the client.
double roundTrip(int socket, const std::string& request, std::size_t replySize, int calls = kCallsARound) {
  const auto start = Clock::now();
  for (int i = 0; i < calls; ++i) {
    if (!sendAll(socket, request) || !receiveAll(socket, replySize)) {
      std::fputs("the other end is gone\n", stderr);
      std::exit(1);
    }
  }
  return std::chrono::duration<double, std::nano>(Clock::now() - start).count() / calls;
}

struct Ends {
  Ends() {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) std::exit(1);
    client = FileDescriptor(ends[0]);
    server = FileDescriptor(ends[1]);
  }
  FileDescriptor client;
  FileDescriptor server;
};

double quantile(std::vector<double> values, double part) {
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(part * static_cast<double>(values.size() - 1))];
}

// The rounds alternate, so that both run under the same conditions.
void compare(const char* name, int core) {
  pinTo(core);
  const std::string request = callFrame(1);
  const std::string reply =
      wire::makeFrame(wire::FrameKind::reply, 1, {{"results", Dictionary{{"reply", "queued"}}}});

  Ends bare;
  std::thread echo([&] {
    while (receiveAll(bare.server.get(), request.size()) && sendAll(bare.server.get(), reply)) {
    }
  });

  platform::DiskFileStore files;
  ipc::Entitlements entitlements(files, "/nonexistent");
  platform::LentFiles lentFiles;
  platform::Counters counters;
  Ends served;
  const auto connection =
      std::make_shared<ipc::SocketConnection>(1, std::move(served.server), ipc::Peer{}, entitlements,
                                              lentFiles, counters, platform::MemoryBudget().accountOf(0));
  connection->setExportedObject(std::make_shared<EchoingSession>());
  connection->resume();
  std::thread serving([&] { connection->run(); });
  const std::string hello = wire::makeFrame(wire::FrameKind::hello, 0, {{"wire", 1}, {"library", "8.0"}});
  const std::size_t answer =
      wire::makeFrame(wire::FrameKind::hello, 0, {{"wire", 1}, {"daemon", "8.0"}}).size();
  sendAll(served.client.get(), hello);
  receiveAll(served.client.get(), answer);

  std::vector<double> floors;
  std::vector<double> calls;
  for (int i = 0; i < kRounds; ++i) {
    floors.push_back(roundTrip(bare.client.get(), request, reply.size()));
    calls.push_back(roundTrip(served.client.get(), request, reply.size()));
  }
  for (const auto& [label, part] : {std::pair("undisturbed", 0.05), std::pair("median", 0.5)}) {
    const double floor = quantile(floors, part);
    const double call = quantile(calls, part);
    std::printf(
        "%s, %s: bare socket %.0f ns, call with reply %.0f ns, ratio %.2f (%zu bytes there, %zu back)\n",
        name, label, floor, call, call / floor, request.size(), reply.size());
  }

  // One way: without replies; the reply to the last call ends the measurement.
  std::string burst;
  for (int i = 0; i < 100; ++i) burst += callFrame(0);
  const auto start = Clock::now();
  for (int i = 0; i < 500; ++i) sendAll(served.client.get(), burst);
  roundTrip(served.client.get(), request, reply.size(), 1);
  const double seconds = std::chrono::duration<double>(Clock::now() - start).count();
  std::printf("%s: %.0f messages a second without replies\n", name, 50'000 / seconds);

  bare.client.reset();
  served.client.reset();
  ::shutdown(bare.server.get(), SHUT_RDWR);
  echo.join();
  serving.join();
}

}  // namespace

int main() {
  compare("one core", 0);
  compare("both free", -1);
  return 0;
}
