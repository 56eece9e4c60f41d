// SPDX-License-Identifier: Apache-2.0
// The commands, options and help texts.
#include "storebag/options.h"

#include <CLI/CLI.hpp>

#include "base/version.h"
#include "storebag/findings.h"
#include "storebag/spelling.h"
#include "wire/constants.h"

namespace veltrad::storebag {

using config::SigningKey;

namespace {

constexpr const char* kFooter =
    R"(FILE "-" is standard input. JSON may have comments.
Exit status: 0 success; 1 refused or failed, or the output shows mistakes or changes; 2 usage error.
For the arguments of a command, see `veltra-storebag COMMAND --help`.

Example, for a storebag quindle.json and devices that have keys/publicKey.der:
  veltra-storebag keygen keys
  veltra-storebag fmt --write quindle.json
  veltra-storebag lint quindle.json
  veltra-storebag sign --key keys/private.pem quindle.json -o quindle
  veltra-storebag verify --key keys/publicKey.der quindle
  veltra-storebag publish quindle /srv/bags
  veltra-storebag rollback quindle /srv/bags)";

CLI::App* addCommand(CLI::App& app, const char* name, const char* about) {
  return app.add_subcommand(name, about)->group("Commands");
}

// Says what is wrong with the name of a finding; empty: nothing.
std::string faultOfName(const std::string& name) {
  if (findingKindNamed(name)) return "";
  std::vector<std::string> known;
  for (const FindingKind& kind : findingKinds()) known.push_back(kind.name);
  const auto meant = closestName(name, known);
  return "no finding has the name " + name + (meant ? "; did you mean " + *meant + "?" : "");
}

void describeKeys(CLI::App& app, Arguments& given) {
  CLI::App* keygen = addCommand(app, "keygen", "Create a signing key: DIR/private.pem and DIR/publicKey.der");
  keygen->add_option("DIR", given.directory, "Directory for the two files, neither of which may exist")
      ->required();
  keygen->add_option("--bits", given.bits, "Length of the modulus in bits")
      ->check(CLI::Range(SigningKey::kFewestBits, SigningKey::kMostBits))
      ->capture_default_str();
  keygen->callback([&given] { given.outcome = storebag::keygen(given.directory, given.bits); });

  CLI::App* sign = addCommand(app, "sign", "Sign a storebag in which lint finds no errors");
  sign->add_option("--key", given.sign.privateKey, "Private key in PEM form")->type_name("FILE")->required();
  sign->add_option("IN", given.sign.in, "The storebag: a property list or JSON")->required();
  sign->add_option("-o,--output", given.sign.out, "The signed container to write")
      ->type_name("FILE")
      ->required();
  sign->add_flag("--force", given.sign.force, "Sign it in spite of errors");
  sign->callback([&given] { given.outcome = storebag::sign(given.sign); });

  CLI::App* verify = addCommand(app, "verify", "Verify a signed storebag as the daemon does");
  verify->add_option("--key", given.key, "Public key in DER form")->type_name("FILE")->required();
  verify->add_option("FILE", given.file, "The container")->required();
  verify->callback([&given] { given.outcome = storebag::verify(given.key, given.file); });

  CLI::App* publish = addCommand(
      app, "publish", "Put signed storebags where a web server serves them, each under its file's name");
  publish->add_option("FILE", given.publish.files, "Signed containers")->required();
  publish->add_option("DIR", given.publish.directory, "The folder that is served")->required();
  publish->add_option("--key", given.publish.publicKey, "Public key in DER form that devices have")
      ->type_name("FILE")
      ->capture_default_str();
  publish->callback([&given] { given.outcome = storebag::publish(given.publish); });

  CLI::App* rollback = addCommand(app, "rollback", "Serve again what was published before");
  rollback->add_option("NAME", given.publish.files, "Names of storebags")->required();
  rollback->add_option("DIR", given.publish.directory, "The folder that is served")->required();
  rollback->callback(
      [&given] { given.outcome = storebag::rollback(given.publish.files, given.publish.directory); });

  CLI::App* show = addCommand(app, "show", "Print a storebag as JSON, without verifying it");
  show->add_option("FILE", given.file, "A container or an unsigned storebag")->required();
  show->add_flag("--json", given.json, "Print it on one line");
  show->callback([&given] { given.outcome = storebag::show(given.file, given.json); });
}

void describeWriting(CLI::App& app, Arguments& given) {
  CLI::App* lint = addCommand(app, "lint", "Report mistakes in storebags, without verifying them");
  lint->add_option("FILE", given.lint.files, "Containers or unsigned storebags")->required();
  lint->add_option("--allow", given.lint.allowed, "Leave findings of this name out; may be repeated")
      ->type_name("NAME")
      ->allow_extra_args(false)
      ->check(CLI::Validator(faultOfName, ""));
  lint->add_flag("--lab", given.lint.lab, "Take ${url} and ${dashboardPort}, which veltra-lab replaces");
  lint->add_flag("--json", given.lint.json, "Print an array of objects");
  lint->callback([&given] { given.outcome = storebag::lint(given.lint); });

  CLI::App* format = addCommand(app, "fmt", "Print a storebag with its keys in order and its comments kept");
  format->add_option("FILE", given.format.file, "The storebag as JSON")->required();
  CLI::Option* write = format->add_flag("--write", given.format.write, "Write it back instead");
  format->add_flag("--check", given.format.check, "Only say whether it would change (exit status 1)")
      ->excludes(write);
  format->callback([&given] { given.outcome = storebag::format(given.format); });

  CLI::App* schema = addCommand(app, "schema", "Print a JSON Schema (draft 07) of storebags, for editors");
  schema->callback([&given] { given.outcome = storebag::schema(); });
}

void addSession(CLI::App& command, Arguments& given) {
  Given& session = given.explain.given;
  command.add_option("--client-type", session.clientType, "Kind of client, which selects the storebag")
      ->type_name("N")
      ->check(CLI::Range(0, 17));
  command
      .add_option_function<std::string>(
          "--environment",
          [&session](const std::string& name) {
            const auto environment = environmentNamed(name);
            if (!environment) throw CLI::ValidationError("--environment", environment.error());
            session.environment = environment.value();
          },
          "Environment of the device, as its section is named [release]")
      ->type_name("NAME");
  for (const auto& [option, key] : {std::pair("--client", wire::kVeltraUserInfoClientName),
                                    std::pair("--service", wire::kVeltraUserInfoServiceName)})
    command
        .add_option_function<std::string>(
            option, [&session, key = key](const std::string& name) { session.setUserInfo(key, name); },
            std::string("User info \"") + key + "\"")
        ->type_name("NAME");
  command
      .add_option("--user-info", given.explain.userInfo, "More user info; repeat the option for each entry")
      ->type_name("KEY=VALUE")
      ->allow_extra_args(false);
  command.add_option("--session-id", session.sessionID, "The client's number for this session")
      ->type_name("N");
  command.add_option("--client-version", session.clientVersion, "The client's version")->type_name("N");
  command.add_flag("--require-user-info", session.requireUserInfo, "Report nothing without user info");
  command.add_flag("--batch-events", session.batchEvents, "Let back ends collect events");
}

void addDevice(CLI::App& command, Arguments& given) {
  Given& session = given.explain.given;
  command.add_option("--country", session.country, "Country of the locale; without it there is none")
      ->type_name("CODE");
  command
      .add_option_function<std::string>(
          "--consent", [&session](const std::string& word) { session.consent = word == "yes"; },
          "Whether the user has consented: yes or no [yes]")
      ->type_name("WORD")
      ->check(CLI::IsMember({"yes", "no"}));
  command
      .add_option("--device", given.explain.device, "Properties of the device, with the keys of device.plist")
      ->type_name("FILE");
  command.add_option("--policy", given.explain.policy, "Limits of the owner, as in policy.json")
      ->type_name("FILE");
  command
      .add_option("--draw", given.explain.draws,
                  "Sampling factor of all back ends, or NAME=X of one; may be repeated [sampled in]")
      ->type_name("X")
      ->allow_extra_args(false);
}

void describePlaying(CLI::App& app, Arguments& given) {
  CLI::App* explain = addCommand(app, "explain", "Show what a storebag does with messages of a session");
  explain->add_option("FILE", given.explain.file, "A container or an unsigned storebag")->required();
  addSession(*explain, given);
  addDevice(*explain, given);
  explain->add_option("--category", given.explain.category, "Category of the message")->type_name("N");
  explain->add_option("--type", given.explain.type, "Type of the message")->type_name("N");
  explain->add_option("--flag", given.explain.flag, "1: realtime, 2: overrides sampling, 3: both")
      ->type_name("N")
      ->check(CLI::Range(0, 3));
  explain->add_option("ENTRY", given.explain.payload, "Entries of the message's payload: KEY=VALUE");
  explain->add_option("--payload", given.explain.payloadFile, "The payload: one JSON object")
      ->type_name("FILE");
  explain
      ->add_option("--messages", given.explain.messages,
                   "Messages as veltractl watch --json --contents and veltractl session have them")
      ->type_name("FILE");
  explain->add_flag("--json", given.explain.json, "Print one object");
  explain->callback([&given] { given.outcome = storebag::explain(given.explain); });

  CLI::App* test = addCommand(app, "test", "Run suites of cases that say what a storebag is to do");
  test->add_option("SUITE", given.test.suites, "Suites as JSON with comments")->required();
  test->add_option("--junit", given.test.junit, "Also write the results there, for build servers")
      ->type_name("FILE");
  test->add_flag("--json", given.test.json, "Print one object");
  test->callback([&given] { given.outcome = storebag::test(given.test); });
}

}  // namespace

void describe(CLI::App& app, Arguments& given) {
  app.name("veltra-storebag");
  app.description("Create signing keys; write, check, try, sign, verify and show storebags.");
  tools::useManualStyle(app);
  app.set_version_flag("--version", std::string("veltra-storebag ") + kVersion, "Print the version");
  app.require_subcommand(1);
  describeKeys(app, given);
  describeWriting(app, given);
  describePlaying(app, given);
  app.footer(kFooter);  // last, because commands inherit it
}

tools::CommandLine commandLine() {
  Arguments given;
  CLI::App app;
  describe(app, given);
  return tools::commandLineOf(app);
}

}  // namespace veltrad::storebag
