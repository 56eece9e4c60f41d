// SPDX-License-Identifier: Apache-2.0
// Sends numbered messages until its input ends, then prints what became of them as one line of JSON.
// Usage: sender NAME MICROSECONDS (between two messages, on average) post|reply (asks for no answers, or for
// all)
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>

#include "veltra/veltra.hpp"

namespace {

using Clock = std::chrono::steady_clock;
constexpr unsigned kBurst = 16;

bool inputEnded() {
  pollfd input{STDIN_FILENO, POLLIN, 0};
  char byte;
  return ::poll(&input, 1, 0) > 0 && ::read(STDIN_FILENO, &byte, 1) <= 0;
}

double microseconds(Clock::duration time) {
  return std::chrono::duration<double, std::micro>(time).count();
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 4) return 2;
  const std::string name = arguments[1];
  const std::chrono::microseconds pause(std::atol(arguments[2]));
  const bool replies = std::string(arguments[3]) == "reply";
  veltra::Session session{{.clientType = 7,
                           .clientName = name,
                           .serviceName = "ringer",
                           .requireUserInfo = true,
                           .batchEvents = true,
                           .connectLater = true}};
  if (!session) {
    std::fprintf(stderr, "%s\n", session.error().description.c_str());
    return 1;
  }
  std::atomic<unsigned long> answered{0}, unanswered{0};
  const auto onReply = [&](const veltra::Reply& reply) { ++(reply ? answered : unanswered); };
  session.start(veltra::Callback());
  unsigned long sent = 0, refused = 0;
  Clock::duration longest{}, all{};
  for (unsigned long round = 0; round % kBurst != 0 || !inputEnded(); ++round) {
    const veltra::Dictionary payload{{"sender", name}, {"number", static_cast<std::uint64_t>(sent)}};
    const auto begin = Clock::now();
    const veltra_status status =
        session.send(5, 1, payload, replies ? veltra::Callback(onReply) : veltra::Callback());
    const auto taken = Clock::now() - begin;
    all += taken;
    longest = std::max(longest, taken);
    ++(status == VELTRA_OK ? sent : refused);
    if (round == kBurst) {
      std::puts("sending");
      std::fflush(stdout);
    }
    // In bursts, so that some are under way when the daemon goes.
    if (pause.count() > 0 && round % kBurst == 0) std::this_thread::sleep_for(kBurst * pause);
  }
  const auto lost = session.counter(VELTRA_COUNTER_LOST);
  const auto connections = session.counter(VELTRA_COUNTER_CONNECTIONS);
  const auto begin = Clock::now();
  const auto closed = session.close();
  std::printf(
      "{\"sender\": \"%s\", \"sent\": %lu, \"refused\": %lu, \"lost\": %lu, \"closed\": %lu, "
      "\"connections\": %lu, "
      "\"answered\": %lu, \"unanswered\": %lu, \"mean\": %.2f, \"longest\": %.1f, \"closing\": %.1f}\n",
      name.c_str(), sent, refused, lost, closed, connections, answered.load(), unanswered.load(),
      microseconds(all) / static_cast<double>(std::max(1ul, sent + refused)), microseconds(longest),
      microseconds(Clock::now() - begin));
  return 0;
}
