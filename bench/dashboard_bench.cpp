// SPDX-License-Identifier: Apache-2.0
// Compares a message to a dashboard (packet, text line, queue and send) with a bare send of the same bytes.
// Prints CPU microseconds of each. A thread reads from the server's socket.
#include <arpa/inet.h>
#include <fmt/format.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <thread>
#include <vector>

#include "fakes/world.h"
#include "wire/constants.h"

namespace {

constexpr int kRounds = 9;
constexpr int kMessages = 20'000;

double threadMicroseconds() {
  timespec time{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
}

double microsecondsOf(const std::function<void()>& one) {
  const double begin = threadMicroseconds();
  for (int i = 0; i < kMessages; ++i) one();
  return (threadMicroseconds() - begin) / kMessages;
}

double median(std::vector<double> numbers) {
  std::sort(numbers.begin(), numbers.end());
  return numbers[numbers.size() / 2];
}

}  // namespace

int main() {
  using namespace veltrad;
  const int server = socket(AF_INET, SOCK_DGRAM, 0);
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t length = sizeof address;
  if (bind(server, reinterpret_cast<sockaddr*>(&address), length) != 0 ||
      getsockname(server, reinterpret_cast<sockaddr*>(&address), &length) != 0)
    return 1;
  World world;
  config::DashboardProfile section;
  section.ip = "127.0.0.1";
  section.port = ntohs(address.sin_port);
  backends::SessionFacts facts;
  facts.compType = 7;
  facts.device.udid = std::string(40, 'a');
  const auto backend = world.factory.newBackendWithName(
      wire::kVeltraBackendDashboard, std::make_shared<const config::Profile>(section), "Elm",
      std::make_shared<const backends::SessionFacts>(facts));
  if (!backend) return 1;
  Dictionary payload;
  for (int i = 0; i < 8; ++i) payload.set("key" + std::to_string(i), "a value of " + std::to_string(i));
  payload.set("seconds", 12.5);
  payload.set("count", 7);

  const int bare = socket(AF_INET, SOCK_DGRAM, 0);
  if (connect(bare, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) return 1;
  backend->sendMessage(&payload, {1, 0}, 5, 10, 0);
  char first[2048];
  const auto bytes = static_cast<std::size_t>(recv(server, first, sizeof first, 0));
  std::thread drain([server] {
    char datagram[2048];
    while (recv(server, datagram, sizeof datagram, 0) > 0) {
    }
  });

  const std::string same(bytes, 'x');
  std::vector<double> floors, whole, ratios;
  for (int round = 0; round < kRounds; ++round) {
    floors.push_back(microsecondsOf([&] { (void)send(bare, same.data(), same.size(), MSG_DONTWAIT); }));
    whole.push_back(microsecondsOf([&] { backend->sendMessage(&payload, {1, 0}, 5, 10, 0); }));
    ratios.push_back(whole.back() / floors.back());
  }
  fmt::print("{{\"bareSendUs\": {:.2f}, \"messageUs\": {:.2f}, \"ratio\": {:.2f}, \"bytes\": {}}}\n",
             median(floors), median(whole), median(ratios), bytes);
  shutdown(server, SHUT_RDWR);
  drain.join();
  close(bare);
  close(server);
  return 0;
}
