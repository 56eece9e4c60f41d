// SPDX-License-Identifier: Apache-2.0
// veltra-lab: the servers of the system for development and tests.
#include <CLI/CLI.hpp>

#include <unistd.h>
#include <csignal>
#include <cstdio>
#include <exception>

#include "directory.h"
#include "formats/json.h"
#include "options.h"
#include "platform/service_manager.h"
#include "server.h"

namespace {

using veltrad::lab::Directory;
using veltrad::lab::Options;
using veltrad::lab::Server;

int fail(const std::string& why) {
  std::fprintf(stderr, "veltra-lab: %s\n", why.c_str());
  return 1;
}

// Called before other threads start, so that only sigwait receives the signals.
sigset_t blockStopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  return signals;
}

int serve(const Directory& directory, const Options& options) {
  const sigset_t signals = blockStopSignals();
  Server server(directory, options.maxAge);
  for (const auto& text : options.rules) {
    auto rule = veltrad::lab::ruleFromJSON(text);
    if (!rule) return fail("--misbehave: " + rule.error());
    server.add(std::move(rule).value());
  }
  if (const auto why = server.start(options.port, options.dashboardPort.value_or(options.port)))
    return fail(*why);
  const veltrad::Dictionary line{{"url", server.url()},
                                 {"logDataURL", server.logDataURL()},
                                 {"uploadURL", server.uploadURL()},
                                 {"dashboardPort", server.dashboardPort()},
                                 {"certificate", directory.certificatePath()},
                                 {"publicKey", directory.publicKeyPath()},
                                 {"ed25519Key", directory.ed25519KeyPath()},
                                 {"pid", static_cast<long>(getpid())}};
  std::printf("%s\n", veltrad::formats::writeJSON(line).c_str());
  std::fflush(stdout);
  veltrad::platform::ServiceManager().ready();
  int signal = 0;
  sigwait(&signals, &signal);
  server.stop();
  return 0;
}

int run(int argc, char** argv) {
  Options options;
  CLI::App app;
  veltrad::lab::describe(app, options);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : 2;
  }
  const auto directory = Directory::open(options.path);
  if (!directory) return fail(directory.error());
  return serve(directory.value(), options);
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "veltra-lab: %s\n", error.what());
    return 1;
  }
}
