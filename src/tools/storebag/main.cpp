// veltra-storebag: makes keys; signs, verifies, shows and checks storebags. The exit status is 0 if done, 1
// if refused, failed or with findings, 2 for wrong usage.
#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <string>

#include "base/version.h"
#include "config/storebag_signing.h"
#include "storebag/commands.h"

namespace {

using veltrad::config::SigningKey;
using veltrad::storebag::Outcome;

struct Arguments {
  std::string directory, key, in, out, file;
  int bits = SigningKey::kFewestBits;
  bool json = false;
  Outcome outcome;
};

void describe(CLI::App& app, Arguments& given) {
  app.set_version_flag("--version", std::string("veltra-storebag ") + veltrad::kVersion, "Print the version");
  app.require_subcommand(1);
  CLI::App* keygen =
      app.add_subcommand("keygen", "Create a signing key: DIR/privateKey.pem and DIR/publicKey.der");
  keygen->add_option("DIR", given.directory, "Directory for the two files, neither of which may exist")
      ->required();
  keygen->add_option("--bits", given.bits, "Length of the modulus in bits")
      ->check(CLI::Range(SigningKey::kFewestBits, SigningKey::kMostBits))
      ->capture_default_str();
  keygen->callback([&given] { given.outcome = veltrad::storebag::keygen(given.directory, given.bits); });

  CLI::App* sign = app.add_subcommand("sign", "Sign a storebag");
  sign->add_option("--key", given.key, "Private key in PEM form")->required();
  sign->add_option("IN", given.in, "The storebag: a property list or JSON")->required();
  sign->add_option("-o,--output", given.out, "The signed container to write")->required();
  sign->callback([&given] { given.outcome = veltrad::storebag::sign(given.key, given.in, given.out); });

  CLI::App* verify = app.add_subcommand("verify", "Verify a signed storebag as the daemon does");
  verify->add_option("--key", given.key, "Public key in DER form")->required();
  verify->add_option("FILE", given.file, "The container")->required();
  verify->callback([&given] { given.outcome = veltrad::storebag::verify(given.key, given.file); });

  CLI::App* show = app.add_subcommand("show", "Print a storebag as JSON, without verifying it");
  show->add_option("FILE", given.file, "A container or an unsigned storebag")->required();
  show->add_flag("--json", given.json, "Print it on one line");
  show->callback([&given] { given.outcome = veltrad::storebag::show(given.file, given.json); });

  CLI::App* lint = app.add_subcommand("lint", "Report mistakes in a storebag, without verifying it");
  lint->add_option("FILE", given.file, "A container or an unsigned storebag")->required();
  lint->callback([&given] { given.outcome = veltrad::storebag::lint(given.file); });
}

}  // namespace

int main(int count, char** arguments) {
  try {
    CLI::App app("Create signing keys; sign, verify, show and check storebags.", "veltra-storebag");
    Arguments given;
    describe(app, given);
    try {
      app.parse(count, arguments);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : 2;
    }
    std::FILE* stream = given.outcome.done ? stdout : stderr;
    const std::string text =
        given.outcome.done ? given.outcome.text : "veltra-storebag: " + given.outcome.text + "\n";
    const bool written =
        std::fwrite(text.data(), 1, text.size(), stream) == text.size() && std::fflush(stream) == 0;
    if (!written && given.outcome.done) std::perror("veltra-storebag: standard output");
    return given.outcome.done && written && !given.outcome.findings ? 0 : 1;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "veltra-storebag: %s\n", error.what());
    return 1;
  }
}
