// SPDX-License-Identifier: Apache-2.0
// Constructs the parts of the gateway and stops them in order.
#include "gateway/serve.h"

#include <sys/resource.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <future>
#include <optional>

#include "formats/json.h"
#include "gateway/admin.h"
#include "gateway/datagram_receiver.h"
#include "gateway/request_router.h"
#include "gateway/work_queue.h"
#include "platform/service_manager.h"

namespace veltrad::gateway {

namespace {

// Open requests are answered until then.
constexpr std::chrono::seconds kLongestStop{10};
// The process ends then, whatever still blocks: what was confirmed is in the stream, or in the tables.
constexpr unsigned kLongestEndSeconds = 14;
constexpr std::size_t kServingStackBytes = 1u << 20;
constexpr std::chrono::seconds kLongestTurn{2};

sigset_t stopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}

int failed(const std::string& why) {
  std::fprintf(stderr, "veltra-gateway: %s\n", why.c_str());
  return 1;
}

// A connection takes a descriptor.
void raiseDescriptorLimit() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);
}

HeldMessages::Bounds heldBounds(const ServeArguments& given) {
  HeldMessages::Bounds bounds;
  bounds.bytes = given.holdBytes;
  bounds.messages = given.holdMessages;
  bounds.hold = std::chrono::duration_cast<HeldMessages::Duration>(std::chrono::duration<double>(given.hold));
  return bounds;
}

BodyBounds bodyBounds(const ServeArguments& given) {
  BodyBounds bounds;
  bounds.eventsTogether = given.holdBytes;
  bounds.othersTogether = given.holdBytes / 2;
  return bounds;
}

Admin::Questions questionsTo(const Publisher& publisher, const Metrics& metrics, HTTPServer& server) {
  return {[&publisher, &server]() -> std::string {
            if (!publisher.ready()) return "the stream is not there";
            return server.answersWithin(kLongestTurn) ? "" : "requests are not being served";
          },
          [&publisher, &metrics, &server] { return metrics.text(server.connections(), publisher.held()); }};
}

}  // namespace

std::string asURL(const std::string& address) {
  return address.starts_with("unix:") ? address : "http://" + address;
}

void blockStopSignals() {
  const sigset_t signals = stopSignals();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  std::signal(SIGPIPE, SIG_IGN);
}

void awaitStop() {
  const sigset_t signals = stopSignals();
  int signal = 0;
  sigwait(&signals, &signal);
  std::signal(SIGALRM, [](int) { ::_exit(0); });
  ::alarm(kLongestEndSeconds);
}

void sayReady(const Dictionary& line) {
  std::printf("%s\n", formats::writeJSON(line).c_str());
  std::fflush(stdout);
  platform::ServiceManager().ready();
}

int serve(const Arguments& given) {
  blockStopSignals();
  raiseDescriptorLimit();
  Metrics metrics;
  auto opened = Publisher::open(given.stream, heldBounds(given.serve), metrics);
  if (!opened) return failed(opened.error());
  // Destroyed first, so that no completion comes after what it uses.
  std::unique_ptr<Publisher> publisher = std::move(opened).value();
  WorkQueue bodies;
  if (!bodies.start()) return failed("a thread cannot be started");
  RequestRouter router(*publisher, metrics, bodyBounds(given.serve), given.serve.shed,
                       [&bodies](WorkQueue::Work work) { bodies.add(std::move(work)); });
  HTTPServer server([&router](const RequestHead& head) { return router.request(head); },
                    {.connections = given.serve.connections, .shortage = given.serve.shed},
                    [&metrics] { metrics.refused.add("no_memory"); });
  const auto listen = server.listen(given.serve.listen);
  if (!listen) return failed("--listen " + listen.error());
  DatagramReceiver datagrams(*publisher, metrics, given.serve.holdMessages / 2);
  Dictionary line{{"listen", asURL(listen.value())}, {"pid", static_cast<long>(::getpid())}};
  if (!given.serve.dashboard.empty()) {
    const auto bound = datagrams.start(given.serve.dashboard);
    if (!bound) return failed("--dashboard " + bound.error());
    line.set("dashboard", bound.value());
  }
  std::optional<Admin> admin(std::in_place, questionsTo(*publisher, metrics, server));
  const auto looked = admin->start(given.serve.admin);
  if (!looked) return failed("--admin " + looked.error());
  line.set("admin", asURL(looked.value()));
  Thread serving;
  if (!serving.start("http", kServingStackBytes, [&server] { server.run(); }))
    return failed("a thread cannot be started");
  sayReady(line);
  awaitStop();
  platform::ServiceManager().stopping();
  const auto end = std::chrono::steady_clock::now() + kLongestStop;
  publisher->endBy(end);
  std::promise<void> idle;
  server.stop([&idle] { idle.set_value(); });
  idle.get_future().wait_until(end + std::chrono::seconds(1));
  // Until now, because senders do not learn that this socket of many has no reader.
  datagrams.stop();
  admin.reset();
  server.end();
  serving.join();
  bodies.end();
  publisher.reset();
  return 0;
}

}  // namespace veltrad::gateway
