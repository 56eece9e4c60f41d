// SPDX-License-Identifier: Apache-2.0
// veltra-gateway: takes what a fleet reports, and writes it to a database.
#include <CLI/CLI.hpp>

#include <cstdio>
#include <exception>

#include "gateway/serve.h"
#include "platform/log.h"

int main(int count, char** arguments) {
  try {
    CLI::App app;
    veltrad::gateway::Arguments given;
    veltrad::gateway::describe(app, given);
    try {
      app.parse(count, arguments);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : 2;
    }
    veltrad::platform::VeltraLogging::startLogging("veltra-gateway", "Daemon");
    return given.drains ? veltrad::gateway::drain(given) : veltrad::gateway::serve(given);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "veltra-gateway: %s\n", error.what());
    return 1;
  }
}
