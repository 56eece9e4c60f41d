// SPDX-License-Identifier: Apache-2.0
// The commands, options and help texts.
#include "storebag/options.h"

#include <CLI/CLI.hpp>

#include "base/version.h"

namespace veltrad::storebag {

using config::SigningKey;

namespace {

constexpr const char* kFooter =
    R"(Exit status: 0 success, 1 refused, failed or, of lint, findings, 2 usage error.
For the arguments of a command, see `veltra-storebag COMMAND --help`.

Example, for a storebag quindle.json and devices that have keys/publicKey.der:
  veltra-storebag keygen keys
  veltra-storebag lint quindle.json
  veltra-storebag sign --key keys/privateKey.pem quindle.json -o quindle
  veltra-storebag verify --key keys/publicKey.der quindle)";

CLI::App* addCommand(CLI::App& app, const char* name, const char* about) {
  return app.add_subcommand(name, about)->group("Commands");
}

}  // namespace

void describe(CLI::App& app, Arguments& given) {
  app.name("veltra-storebag");
  app.description("Create signing keys; sign, verify, show and check storebags.");
  tools::useManualStyle(app);
  app.set_version_flag("--version", std::string("veltra-storebag ") + kVersion, "Print the version");
  app.require_subcommand(1);
  CLI::App* keygen =
      addCommand(app, "keygen", "Create a signing key: DIR/privateKey.pem and DIR/publicKey.der");
  keygen->add_option("DIR", given.directory, "Directory for the two files, neither of which may exist")
      ->required();
  keygen->add_option("--bits", given.bits, "Length of the modulus in bits")
      ->check(CLI::Range(SigningKey::kFewestBits, SigningKey::kMostBits))
      ->capture_default_str();
  keygen->callback([&given] { given.outcome = storebag::keygen(given.directory, given.bits); });

  CLI::App* sign = addCommand(app, "sign", "Sign a storebag");
  sign->add_option("--key", given.key, "Private key in PEM form")->type_name("FILE")->required();
  sign->add_option("IN", given.in, "The storebag: a property list or JSON")->required();
  sign->add_option("-o,--output", given.out, "The signed container to write")->type_name("FILE")->required();
  sign->callback([&given] { given.outcome = storebag::sign(given.key, given.in, given.out); });

  CLI::App* verify = addCommand(app, "verify", "Verify a signed storebag as the daemon does");
  verify->add_option("--key", given.key, "Public key in DER form")->type_name("FILE")->required();
  verify->add_option("FILE", given.file, "The container")->required();
  verify->callback([&given] { given.outcome = storebag::verify(given.key, given.file); });

  CLI::App* show = addCommand(app, "show", "Print a storebag as JSON, without verifying it");
  show->add_option("FILE", given.file, "A container or an unsigned storebag")->required();
  show->add_flag("--json", given.json, "Print it on one line");
  show->callback([&given] { given.outcome = storebag::show(given.file, given.json); });

  CLI::App* lint = addCommand(app, "lint", "Report mistakes in a storebag, without verifying it");
  lint->add_option("FILE", given.file, "A container or an unsigned storebag")->required();
  lint->callback([&given] { given.outcome = storebag::lint(given.file); });
  app.footer(kFooter);  // last, because commands inherit it
}

tools::CommandLine commandLine() {
  Arguments given;
  CLI::App app;
  describe(app, given);
  return tools::commandLineOf(app);
}

}  // namespace veltrad::storebag
