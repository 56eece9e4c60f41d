// SPDX-License-Identifier: Apache-2.0
// Compares sends of one client with a bare socket ping-pong of the same bytes, interleaved in one run. Prints
// JSON. Usage: send_bench ROOT (the daemon of that root must serve client type 6 with a batching back end)
#include <fmt/format.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <veltra/veltra.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <string>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;
constexpr int kRounds = 300;
constexpr int kCallsARound = 100;
constexpr int kOneWay = 100'000;
// The frames of such a call and of its reply without a text, with their headers.
constexpr std::size_t kCallBytes = 395;
constexpr std::size_t kReplyBytes = 66;

[[noreturn]] void fail(const std::string& text) {
  std::fprintf(stderr, "send_bench: %s\n", text.c_str());
  std::exit(1);
}

void onCore(int core) {
  if (core < 0) return;
  cpu_set_t set;
  CPU_ZERO(&set);
  CPU_SET(core, &set);
  sched_setaffinity(0, sizeof set, &set);
}

[[noreturn]] void throwBack(int socket) {
  std::vector<char> buffer(kCallBytes);
  for (;;) {
    std::size_t have = 0;
    while (have < kCallBytes) {
      const ssize_t got = read(socket, buffer.data(), kCallBytes - have);
      if (got <= 0) _exit(0);
      have += static_cast<std::size_t>(got);
    }
    if (write(socket, buffer.data(), kReplyBytes) < 0) _exit(0);
  }
}

void bareTrip(int socket) {
  static std::vector<char> buffer(kCallBytes, 'x');
  if (write(socket, buffer.data(), kCallBytes) < 0) fail("the bare socket broke");
  std::size_t have = 0;
  while (have < kReplyBytes) {
    const ssize_t got = read(socket, buffer.data(), kReplyBytes - have);
    if (got <= 0) fail("the bare socket broke");
    have += static_cast<std::size_t>(got);
  }
}

// A process that sends back what it receives; it runs on that core alone, unless -1.
int bareEnd(int core, pid_t& child) {
  int pair[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair) != 0) fail("no socket pair");
  child = fork();
  if (child == 0) {
    close(pair[0]);
    onCore(core);
    throwBack(pair[1]);
  }
  close(pair[1]);
  return pair[0];
}

veltra_value* payload() {
  veltra_value* made = veltra_dictionary();
  for (int i = 0; i < 8; ++i) {
    const std::string key = fmt::format("field{}", i);
    veltra_dictionary_set(made, key.c_str(), veltra_string(fmt::format("value number {}", i).c_str()));
  }
  veltra_dictionary_set(made, "seconds", veltra_real(12.5));
  veltra_dictionary_set(made, "count", veltra_signed(42));
  return made;
}

double nanosecondsOf(const std::function<void()>& trip) {
  const auto begin = Clock::now();
  for (int i = 0; i < kCallsARound; ++i) trip();
  return std::chrono::duration<double, std::nano>(Clock::now() - begin).count() / kCallsARound;
}

double median(std::vector<double> numbers) {
  std::sort(numbers.begin(), numbers.end());
  return numbers[numbers.size() / 2];
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 2) fail("usage: send_bench ROOT");
  pid_t child = 0;
  const int free = bareEnd(-1, child);

  veltra_session_options options;
  veltra_session_options_init(&options);
  options.root = arguments[1];
  options.has_client_type = true;
  options.client_type = 6;
  options.batch_events = true;
  char* error = nullptr;
  veltra_session* session = veltra_session_create(&options, nullptr, &error);
  if (!session) fail(error);
  veltra_reply* started = nullptr;
  if (veltra_session_start_wait(session, &started) != VELTRA_OK || !veltra_reply_backends(started)) {
    fail("no back ends: is the root's daemon configured for client type 6?");
  }
  veltra_value* message = payload();
  const auto sendTrip = [&] {
    if (veltra_session_send_wait(session, 5, 2, message, 0, nullptr) != VELTRA_OK) fail("a send failed");
  };
  std::vector<double> bare, sent, ratios;
  for (int round = 0; round < kRounds; ++round) {
    bare.push_back(nanosecondsOf([&] { bareTrip(free); }));
    sent.push_back(nanosecondsOf(sendTrip));
    ratios.push_back(sent.back() / bare.back());
  }
  // The cost of using two cores: if the scheduler keeps both ends of the bare socket on one core, that floor
  // is too low.
  double apart = 0;
  cpu_set_t allowed;
  sched_getaffinity(0, sizeof allowed, &allowed);
  if (CPU_ISSET(0, &allowed) && CPU_ISSET(1, &allowed)) {
    pid_t far = 0;
    const int socket = bareEnd(1, far);
    onCore(0);
    std::vector<double> trips;
    for (int round = 0; round < kRounds; ++round) trips.push_back(nanosecondsOf([&] { bareTrip(socket); }));
    apart = median(trips);
    sched_setaffinity(0, sizeof allowed, &allowed);
    close(socket);
    waitpid(far, nullptr, 0);
  }
  const auto begin = Clock::now();
  int dropped = 0;
  for (int i = 0; i < kOneWay; ++i) {
    while (veltra_session_send(session, 5, 2, message, 0, nullptr, nullptr) == VELTRA_QUEUE_FULL) {
      ++dropped;
      sched_yield();
    }
  }
  sendTrip();  // answered after all other calls
  const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
  fmt::print(
      "{{\"bareNs\": {:.0f}, \"bareApartNs\": {:.0f}, \"sendNs\": {:.0f}, \"ratio\": {:.2f}, "
      "\"oneWayPerSecond\": {:.0f}, "
      "\"roundTrips\": {}, \"oneWay\": {}, \"queueFull\": {}}}\n",
      median(bare), apart, median(sent), median(ratios), kOneWay / seconds, kRounds * kCallsARound, kOneWay,
      dropped);
  veltra_release(message);
  veltra_reply_release(started);
  veltra_session_close(session);
  close(free);
  waitpid(child, nullptr, 0);
  return 0;
}
