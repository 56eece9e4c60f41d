// SPDX-License-Identifier: Apache-2.0
// The command line of veltra-storebag.
#pragma once

#include <string>

#include "config/storebag_signing.h"
#include "storebag/commands.h"
#include "storebag/publish.h"
#include "tools/command_line.h"

namespace veltrad::storebag {

// What the command line gives. Its 16 fields are the options of all commands and the outcome.
struct Arguments {
  std::string directory, key, ed25519, file;
  int bits = config::SigningKey::kFewestBits;
  bool json = false;
  bool ed25519Key = false;
  SignRequest sign;
  PublishRequest publish;
  RollbackRequest rollback;
  LintRequest lint;
  FormatRequest format;
  ExplainRequest explain;
  DiffRequest diff;
  TestRequest test;
  // The outcome of the command, which runs while the arguments are parsed.
  Outcome outcome;
};

void describe(CLI::App& app, Arguments& given);

// For the reference pages.
tools::CommandLine commandLine();

}  // namespace veltrad::storebag
