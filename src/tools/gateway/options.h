// SPDX-License-Identifier: Apache-2.0
// The command line of veltra-gateway.
#pragma once

#include <cstddef>
#include <string>

#include "gateway/nats_connection.h"
#include "tools/command_line.h"

namespace veltrad::gateway {

struct ServeArguments {
  std::string listen = "127.0.0.1:8080";
  std::string admin = "127.0.0.1:8081";
  // Empty: no datagrams are taken.
  std::string dashboard;
  double hold = 15;
  std::size_t holdBytes = 256u << 20;
  std::size_t holdMessages = 16'384;
  std::size_t connections = 16'000;
  int shed = 429;
};

struct DrainArguments {
  std::string admin = "127.0.0.1:8082";
  // As libpq takes it; empty: from the environment.
  std::string database;
  std::string files = "files";
  int batch = 1'000;
  double statement = 60;
  double purgeAfter = 150;
  double postDays = 8;
  double keepDays = 0;
};

struct Arguments {
  StreamOptions stream;
  ServeArguments serve;
  DrainArguments drain;
  bool drains = false;
};

void describe(CLI::App& app, Arguments& given);

// For the reference pages.
tools::CommandLine commandLine();

}  // namespace veltrad::gateway
