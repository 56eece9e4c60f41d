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

template <typename Target>
CLI::Option* addFile(CLI::App& command, const char* name, Target& target, const char* help) {
  return command.add_option(name, target, help)->type_name("FILE");
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
  keygen->add_flag("--ed25519", given.ed25519Key,
                   "Create one for the second signature instead: DIR/ed25519.pem and DIR/ed25519.der");
  keygen->callback(
      [&given] { given.outcome = storebag::keygen(given.directory, given.bits, given.ed25519Key); });

  CLI::App* sign = addCommand(app, "sign", "Sign a storebag in which lint finds no errors");
  addFile(*sign, "--key", given.sign.privateKey, "Private key in PEM form")->required();
  sign->add_option("IN", given.sign.in, "The storebag: a property list or JSON")->required();
  addFile(*sign, "-o,--output", given.sign.out, "The signed container to write")->required();
  addFile(*sign, "--ed25519", given.sign.ed25519,
          "Ed25519 private key that signs as well; repeat the option for more")
      ->allow_extra_args(false);
  sign->add_option("--serial", given.sign.serial, "Write this serial into the storebag first")
      ->type_name("N")
      ->check(CLI::Range(std::int64_t{0}, std::int64_t{9'007'199'254'740'991}));
  sign->add_option("--expires", given.sign.expires,
                   "Write this date (2026-12-31) or date and time (RFC 3339) into it")
      ->type_name("DATE");
  sign->add_option("--name", given.sign.name, "Write the name that it is served under into it")
      ->type_name("NAME");
  sign->add_flag("--force", given.sign.force, "Sign it in spite of errors");
  sign->callback([&given] { given.outcome = storebag::sign(given.sign); });

  CLI::App* verify = addCommand(app, "verify", "Verify a signed storebag as the daemon does");
  addFile(*verify, "--key", given.key, "Public key in DER form")->required();
  addFile(*verify, "--ed25519", given.ed25519,
          "Public key whose Ed25519 signature must be there, too, in DER or PEM form");
  verify->add_option("FILE", given.file, "The container")->required();
  verify->callback([&given] { given.outcome = storebag::verify(given.key, given.file, given.ed25519); });
}

void describeServing(CLI::App& app, Arguments& given) {
  CLI::App* publish = addCommand(
      app, "publish", "Put signed storebags where a web server serves them, each under its file's name");
  publish->positionals_at_end();  // the last one is DIR
  publish->add_option("FILE", given.publish.files, "Signed containers")->required();
  publish->add_option("DIR", given.publish.directory, "The folder that is served")->required();
  addFile(*publish, "--key", given.publish.publicKey, "Public key in DER form that devices have")
      ->capture_default_str();
  addFile(*publish, "--ed25519", given.publish.ed25519,
          "Public key whose Ed25519 signature must be there, too, in DER or PEM form");
  publish->callback([&given] { given.outcome = storebag::publish(given.publish); });

  CLI::App* rollback = addCommand(app, "rollback", "Serve again what was published before");
  rollback->positionals_at_end();
  rollback->add_option("NAME", given.rollback.names, "Names of storebags")->required();
  rollback->add_option("DIR", given.rollback.directory, "The folder that is served")->required();
  rollback->add_flag("--force", given.rollback.force,
                     "Also if devices can refuse it, for its serial or its date");
  rollback->callback([&given] { given.outcome = storebag::rollback(given.rollback); });

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

// An option whose value `take` reads; it returns what is wrong with the value.
template <typename Value, typename Take>
CLI::Option* addTaken(CLI::App& command, const std::string& name, const std::string& help, Take take) {
  return command.add_option_function<Value>(
      name,
      [name, take](const Value& value) {
        if (const std::optional<std::string> fault = take(value)) throw CLI::ValidationError(name, *fault);
      },
      help);
}

// The same for one that may be repeated.
template <typename Take>
CLI::Option* addEach(CLI::App& command, const std::string& name, const std::string& help, Take take) {
  const auto takeAll = [take](const std::vector<std::string>& values) {
    std::optional<std::string> fault;
    for (std::size_t i = 0; i < values.size() && !fault; ++i) fault = take(values[i]);
    return fault;
  };
  return addTaken<std::vector<std::string>>(command, name, help, takeAll)->allow_extra_args(false);
}

void addSession(CLI::App& command, SimulatedSession& played) {
  Given& session = played.given;
  command.add_option("--client-type", session.clientType, "Kind of client, which selects the storebag")
      ->type_name("N")
      ->check(CLI::Range(0, 17));
  addTaken<std::string>(command, "--environment",
                        "Environment of the device, as its section is named [release]",
                        [&session](const std::string& name) { return session.takeEnvironment(name); })
      ->type_name("NAME");
  for (const auto& [option, key] : {std::pair("--client", wire::kVeltraUserInfoClientName),
                                    std::pair("--service", wire::kVeltraUserInfoServiceName)})
    command
        .add_option_function<std::string>(
            option, [&session, key = key](const std::string& name) { session.setUserInfo(key, name); },
            std::string("User info \"") + key + "\"")
        ->type_name("NAME");
  addEach(command, "--user-info", "More user info; repeat the option for each entry",
          [&session](const std::string& text) { return session.takeUserInfo(text); })
      ->type_name("KEY=VALUE");
  command.add_option("--session-id", session.sessionID, "The client's number for this session")
      ->type_name("N");
  command.add_option("--client-version", session.clientVersion, "The client's version")->type_name("N");
  command.add_flag("--require-user-info", session.requireUserInfo, "Report nothing without user info");
  command.add_flag("--batch-events", session.batchEvents, "Let back ends collect events");
}

void addDevice(CLI::App& command, SimulatedSession& played) {
  Given& session = played.given;
  addTaken<std::string>(command, "--country", "Country of the locale; without it there is none",
                        [&session](const std::string& code) { return session.takeCountry(code); })
      ->type_name("CODE");
  command
      .add_option_function<std::string>(
          "--consent", [&session](const std::string& word) { session.consent = word == "yes"; },
          "Whether the user has consented: yes or no [yes]")
      ->type_name("WORD")
      ->check(CLI::IsMember({"yes", "no"}));
  addFile(command, "--device", played.device, "Properties of the device, with the keys of device.plist");
  addFile(command, "--policy", played.policy, "Limits of the owner, as in policy.json");
  addEach(command, "--draw",
          "Sampling factor of all back ends, or NAME=X of one; may be repeated [sampled in]",
          [&session](const std::string& text) { return session.takeDraw(text); })
      ->type_name("X");
  addFile(command, "--messages", played.messages,
          "Messages as veltractl watch --json --contents and veltractl session have them");
}

void describePlaying(CLI::App& app, Arguments& given) {
  CLI::App* explain = addCommand(app, "explain", "Show what a storebag does with messages of a session");
  explain->add_option("FILE", given.explain.file, "A container or an unsigned storebag")->required();
  addSession(*explain, given.explain.session);
  addDevice(*explain, given.explain.session);
  explain->add_option("--category", given.explain.category, "Category of the message")->type_name("N");
  explain->add_option("--type", given.explain.type, "Type of the message")->type_name("N");
  explain->add_option("--flag", given.explain.flag, "1: realtime, 2: overrides sampling, 3: both")
      ->type_name("N")
      ->check(CLI::Range(0, 3));
  explain->add_option("ENTRY", given.explain.payload, "Entries of the message's payload: KEY=VALUE");
  addFile(*explain, "--payload", given.explain.payloadFile, "The payload: one JSON object");
  explain->add_flag("--json", given.explain.json, "Print one object");
  explain->callback([&given] { given.outcome = storebag::explain(given.explain); });

  CLI::App* diff = addCommand(
      app, "diff", "Show what changes between two states of a storebag, the worst for users first");
  diff->add_option("OLD", given.diff.before, "The storebag before, signed or not")->required();
  diff->add_option("NEW", given.diff.now, "The storebag now, signed or not")->required();
  addDevice(*diff, given.diff.session);
  addSession(*diff, given.diff.session);
  diff->add_flag("--json", given.diff.json, "Print one object");
  diff->callback([&given] { given.outcome = storebag::diff(given.diff); });

  CLI::App* test = addCommand(app, "test", "Run suites of cases that say what a storebag is to do");
  test->add_option("SUITE", given.test.suites, "Suites as JSON with comments")->required();
  addFile(*test, "--junit", given.test.junit, "Also write the results there, for build servers");
  test->add_flag("--json", given.test.json, "Print one object");
  test->callback([&given] { given.outcome = storebag::test(given.test); });
}

}  // namespace

void describe(CLI::App& app, Arguments& given) {
  app.name("veltra-storebag");
  app.description("Create signing keys; write, check, try, compare, sign, verify and show storebags.");
  tools::useManualStyle(app);
  app.set_version_flag("--version", std::string("veltra-storebag ") + kVersion, "Print the version");
  app.require_subcommand(1);
  describeKeys(app, given);
  describeServing(app, given);
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
