// SPDX-License-Identifier: Apache-2.0
// A client that sends as it is told, and the bare socket beside it. Each way prints one JSON object a line.
// Usage: load WAY ROOT CLIENT-TYPE A B, where WAY A B is one of
//   trips CORE ROUNDS       sends with reply and bare trips in turn; the bare end is on CORE (-1: any), and
//                           this end is on core 0 unless CORE is -1
//   flood SESSIONS MESSAGES prints {"sessions"}, then sends at each line of standard input, without replies,
//                           prints the time until the last is taken in, and ends with its input
//   waits SESSIONS MESSAGES the same with replies, one at a time
//   posts SESSIONS MESSAGES the same, with a flush after each message
//   latency RATE SECONDS    RATE 0: as fast as replies come
// or load bare CORE 0 RATE SECONDS; this end of both is on core 0.
#include <fmt/format.h>
#include <sched.h>
#include <sys/prctl.h>
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

#include "message.h"

namespace {

using Clock = std::chrono::steady_clock;
using Seconds = std::chrono::duration<double>;
using Trip = std::function<void()>;

constexpr int kCallsARound = 100;
// The frames of such a call and of its reply without a text, with their headers.
constexpr std::size_t kCallBytes = 395;
constexpr std::size_t kReplyBytes = 66;

[[noreturn]] void fail(const std::string& text) {
  std::fprintf(stderr, "load: %s\n", text.c_str());
  std::exit(1);
}

void say(const std::string& line) {
  std::puts(line.c_str());
  std::fflush(stdout);
}

void onCore(int core) {
  if (core < 0) return;
  cpu_set_t set;
  CPU_ZERO(&set);
  CPU_SET(core, &set);
  if (sched_setaffinity(0, sizeof set, &set) != 0) fail(fmt::format("cannot run on core {}", core));
}

// The other end of a bare socket: a process that answers what it receives.
class BareEnd {
 public:
  explicit BareEnd(int core) {
    int pair[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair) != 0) fail("no socket pair");
    _socket = pair[0];
    _child = fork();
    if (_child == 0) {
      close(pair[0]);
      onCore(core);
      throwBack(pair[1]);
    }
    close(pair[1]);
  }
  ~BareEnd() {
    close(_socket);
    waitpid(_child, nullptr, 0);
  }
  BareEnd(const BareEnd&) = delete;
  BareEnd& operator=(const BareEnd&) = delete;

  void trip() {
    if (write(_socket, _room, kCallBytes) < 0 || !take(_socket, _room, kReplyBytes))
      fail("the bare socket broke");
  }

 private:
  static bool take(int socket, char* room, std::size_t bytes) {
    for (std::size_t have = 0; have < bytes;) {
      const ssize_t got = read(socket, room, bytes - have);
      if (got <= 0) return false;
      have += static_cast<std::size_t>(got);
    }
    return true;
  }
  [[noreturn]] static void throwBack(int socket) {
    char room[kCallBytes] = {};
    while (take(socket, room, kCallBytes)) {
      if (write(socket, room, kReplyBytes) < 0) break;
    }
    _exit(0);
  }

  int _socket;
  pid_t _child;
  char _room[kCallBytes] = {};
};

// Started sessions, used in turn.
class Sessions {
 public:
  Sessions(const char* root, int clientType, int count) {
    veltra_session_options options;
    veltra_session_options_init(&options);
    options.root = root;
    options.has_client_type = true;
    options.client_type = clientType;
    options.has_session_id = true;
    options.client_name = "phone";
    options.service_name = "bench";
    options.require_user_info = true;
    options.batch_events = true;
    for (int i = 0; i < count; ++i) {
      options.session_id = static_cast<std::uint32_t>(i + 1);
      char* error = nullptr;
      veltra_session* session = veltra_session_create(&options, nullptr, &error);
      if (!session) fail(error);
      if (veltra_session_start_wait(session, nullptr) != VELTRA_OK) fail("a session does not start");
      _all.push_back(session);
    }
    _message = veltra_dictionary();
    for (int i = 0; i < bench::kTexts; ++i) {
      veltra_dictionary_set(_message, bench::keyOfText(i).c_str(), veltra_string(bench::textOf(i).c_str()));
    }
    veltra_dictionary_set(_message, "seconds", veltra_real(bench::kSeconds));
    veltra_dictionary_set(_message, "count", veltra_signed(bench::kCount));
  }
  ~Sessions() {
    veltra_release(_message);
    for (veltra_session* session : _all) veltra_session_close(session);
  }
  Sessions(const Sessions&) = delete;
  Sessions& operator=(const Sessions&) = delete;

  void sendAndWait() {
    vary();
    if (veltra_session_send_wait(next(), bench::kCategory, bench::kType, _message, 0, nullptr) != VELTRA_OK)
      fail("a send failed");
  }
  // Waits where a queue is full, and returns how often.
  int send() {
    veltra_session* const session = next();
    vary();
    for (int full = 0;; ++full) {
      const auto status =
          veltra_session_send(session, bench::kCategory, bench::kType, _message, 0, nullptr, nullptr);
      if (status == VELTRA_OK) return full;
      if (status != VELTRA_QUEUE_FULL) fail(veltra_status_text(status));
      sched_yield();
    }
  }
  // All that was sent has been taken in, and what was batched is posted.
  void settle() {
    for (veltra_session* session : _all) {
      if (veltra_session_flush_wait(session, nullptr) != VELTRA_OK) fail("a flush failed");
    }
  }

 private:
  // No two messages are the same, or they would compress better than any.
  void vary() {
    const std::uint64_t mixed = (_turn + 1) * 0x9e3779b97f4a7c15;
    veltra_dictionary_set(_message, bench::keyOfText(0).c_str(),
                          veltra_string(fmt::format("{:014x}", mixed >> 8).c_str()));
  }
  veltra_session* next() { return _all[_turn++ % _all.size()]; }

  std::vector<veltra_session*> _all;
  std::size_t _turn = 0;
  veltra_value* _message;
};

double nanosecondsOf(const Trip& trip) {
  const auto begin = Clock::now();
  for (int i = 0; i < kCallsARound; ++i) trip();
  return std::chrono::duration<double, std::nano>(Clock::now() - begin).count() / kCallsARound;
}

double quantile(std::vector<double>& numbers, double part) {
  const auto place = static_cast<std::ptrdiff_t>(part * static_cast<double>(numbers.size() - 1));
  std::nth_element(numbers.begin(), numbers.begin() + place, numbers.end());
  return numbers[static_cast<std::size_t>(place)];
}

int trips(const char* root, int clientType, int core, int rounds) {
  onCore(core < 0 ? -1 : 0);
  BareEnd bare(core);
  Sessions session(root, clientType, 1);
  std::vector<double> floors, sends, ratios;
  for (int round = 0; round < rounds; ++round) {
    floors.push_back(nanosecondsOf([&] { bare.trip(); }));
    sends.push_back(nanosecondsOf([&] { session.sendAndWait(); }));
    ratios.push_back(sends.back() / floors.back());
  }
  say(fmt::format("{{\"bareNs\": {:.0f}, \"sendNs\": {:.0f}, \"ratio\": {:.3f}}}", quantile(floors, 0.5),
                  quantile(sends, 0.5), quantile(ratios, 0.5)));
  return 0;
}

int obey(const char* root, int clientType, int count, int messages, const std::string& way) {
  Sessions sessions(root, clientType, count);
  say(fmt::format("{{\"sessions\": {}}}", count));
  for (int order = std::getchar(); order != EOF; order = std::getchar()) {
    const auto begin = Clock::now();
    int full = 0;
    for (int i = 0; i < messages; ++i) {
      if (way == "flood") {
        full += sessions.send();
      } else {
        sessions.sendAndWait();
      }
      if (way == "posts") sessions.settle();
    }
    sessions.settle();
    say(fmt::format("{{\"seconds\": {:.6f}, \"messages\": {}, \"queueFull\": {}}}",
                    Seconds(Clock::now() - begin).count(), messages, full));
  }
  return 0;
}

// A trip that is due while the one before is under way counts from when it was due; one that the timer began
// late counts from its beginning.
int latency(const Trip& trip, double rate, double seconds) {
  prctl(PR_SET_TIMERSLACK, 1);
  for (int i = 0; i < 1000; ++i) trip();
  std::vector<double> took;
  const auto begin = Clock::now();
  auto now = begin;
  for (int i = 0; Seconds(now - begin).count() < seconds; ++i) {
    auto due = now;
    if (rate > 0) {
      due = begin + std::chrono::duration_cast<Clock::duration>(Seconds(i / rate));
      if (due > now) {
        const std::chrono::nanoseconds left = due - now;
        const timespec pause{left.count() / 1'000'000'000, left.count() % 1'000'000'000};
        nanosleep(&pause, nullptr);
        due = Clock::now();
      }
    }
    trip();
    now = Clock::now();
    took.push_back(std::chrono::duration<double, std::micro>(now - due).count());
  }
  const double reached = static_cast<double>(took.size()) / Seconds(now - begin).count();
  say(fmt::format("{{\"rate\": {:.0f}, \"p50\": {:.2f}, \"p99\": {:.2f}, \"p999\": {:.2f}}}", reached,
                  quantile(took, 0.5), quantile(took, 0.99), quantile(took, 0.999)));
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 6)
    fail("usage: load trips|flood|waits|posts|latency|bare with four arguments; see its source");
  const std::string way = arguments[1];
  const int second = std::atoi(arguments[3]);
  const int third = std::atoi(arguments[4]);
  const int fourth = std::atoi(arguments[5]);
  if (way == "trips") return trips(arguments[2], second, third, fourth);
  if (way == "flood" || way == "waits" || way == "posts")
    return obey(arguments[2], second, third, fourth, way);
  if (way == "latency" || way == "bare") onCore(0);
  if (way == "latency") {
    Sessions session(arguments[2], second, 1);
    return latency([&] { session.sendAndWait(); }, std::atof(arguments[4]), std::atof(arguments[5]));
  }
  if (way == "bare") {
    BareEnd bare(std::atoi(arguments[2]));
    return latency([&] { bare.trip(); }, std::atof(arguments[4]), std::atof(arguments[5]));
  }
  fail("unknown way " + way);
}
