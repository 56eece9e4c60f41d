// SPDX-License-Identifier: Apache-2.0
// Parses the command line, and catches the exceptions of CLI11.
#include "tools/ctl/options.h"

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <sstream>
#include <vector>

#include "base/text.h"
#include "config/preference_keys.h"
#include "tools/ctl/command_options.h"
#include "tools/ctl/option_kinds.h"
#include "tools/key_value.h"
#include "veltra/veltra.h"
#include "wire/constants.h"

namespace veltrad::ctl {
namespace {

constexpr const char* kExpectedCommands =
    "expected session, send, one-shot, states, display-url, upload, upload-log-data, stats, status, "
    "metrics, doctor, config, refresh, report, spool, privacy, history, why or watch";

// Arguments in text form.
struct Texts {
  std::optional<std::string> client;
  std::optional<std::string> service;
  std::vector<std::string> userInfo;
  std::vector<std::string> payload;
};

std::string keyValueProblem(const std::string& text) {
  const auto entry = tools::parseKeyValue(text);
  return entry ? std::string() : entry.error();
}

std::string textProblem(const std::string& text) {
  return isUTF8(text) ? std::string() : fmt::format("\"{}\": expected UTF-8", escapedForLog(text));
}

std::string flagProblem(const std::string& text) {
  if (text.size() == 1 && text[0] >= '0' && text[0] <= '3') return {};
  return fmt::format("expected an integer from 0 to 3, found \"{}\"", escapedForLog(text));
}

void addText(CLI::App& app, const std::string& name, std::optional<std::string>& target,
             const std::string& help) {
  app.add_option(name, target, help)
      ->type_name("NAME")
      ->check(CLI::Validator(textProblem, ""))
      ->group("Identity");
}

// `oneEach`: the option takes one value, because further arguments belong to the command.
void addIdentity(CLI::App& app, Identity& identity, Texts& texts, bool oneEach) {
  const char* group = "Identity";
  addNumber(app, "--client-type", identity.clientType,
            "Kind of client, which selects the storebag; 0 to 17 are defined")
      ->group(group);
  addNumber(app, "--session-id", identity.sessionID, "The client's number for this session")->group(group);
  addNumber(app, "--client-version", identity.clientVersion, "The client's version, 0 to 65535")
      ->group(group);
  addText(app, "--client", texts.client, "User info \"clientName\"");
  addText(app, "--service", texts.service, "User info \"serviceName\"");
  app.add_option("--user-info", texts.userInfo,
                 oneEach ? "More user info; repeat the option for each entry"
                         : "More user info, any number of entries")
      ->type_name("KEY=VALUE")
      ->check(CLI::Validator(keyValueProblem, ""))
      ->group(group)
      ->expected(1, oneEach ? 1 : CLI::detail::expected_max_vector_size)
      ->allow_extra_args(!oneEach);
  app.add_flag("--require-user-info", identity.requireUserInfo, "Report nothing without user info")
      ->group(group);
  app.add_flag("--batch-events", identity.batchEvents, "Let back ends collect events and post them together")
      ->group(group);
}

constexpr const char* kSessionFooter =
    R"(Reads one JSON object per line and answers each with one line, in order:
  {"op":"send","category":5,"type":1,"payload":{"codec":"opus"},"flag":0}
  {"op":"flush"}
  {"op":"states","userInfo":{"clientName":"phone"}}
  {"op":"displayURL"}
  {"op":"uploadFile","path":"a.log"}
  {"op":"uploadLogData","data":[{"file":"a.log"},1]}
  {"op":"restart"}            start the session again
  {"op":"sleep","ms":100}
  {"op":"finish"}             finish the session; at the end of the input it is only closed
{"$date": seconds since 1970} stands for a date, {"$data": "base64"} for data.

With --aggregate, copies are printed between the answers, one per line, with null for absent values:
  {"op":"aggregated","sessionInfo":{…},"timestamp":…,"category":5,"type":1,"payload":{…}}

Example:
  echo '{"op":"flush"}' | veltractl session --client-type 7 --client phone --service ringer)";

// Shows the form of positional arguments, and calls subcommands commands.
class Help : public CLI::Formatter {
 public:
  Help() {
    label("SUBCOMMAND", "COMMAND");
    column_width(34);
  }
  std::string make_option_name(const CLI::Option* option, bool positional) const override {
    if (!positional) return Formatter::make_option_name(option, positional);
    std::string name = option->get_name();
    if (name == "payload") return "KEY=VALUE";
    for (char& c : name) c = static_cast<char>(c - 'a' + 'A');
    return name;
  }
};

void addSession(CLI::App& app, Options& options, Texts& texts) {
  CLI::App* session = addCommand(app, options, Command::session, "session",
                                 "Start a session and run one operation per input line");
  session->add_flag("--aggregate", options.aggregate, "Also print copies of the session's messages");
  session->add_option("--input", options.input, "Read the lines from FILE instead of standard input")
      ->type_name("FILE");
  addIdentity(*session, options.identity, texts, false);
  session->footer(kSessionFooter);
}

void addMessage(CLI::App& app, Options& options, Texts& texts) {
  addNumber(app, "--category", options.category, "What the message is about, 0 to 65535")->required();
  addNumber(app, "--type", options.type, "Which message of the category, 0 to 65535")->required();
  app.add_option("payload", texts.payload,
                 "Entries of the payload. 12, -0.5 and 1e3 become numbers, true and\n"
                 "false become booleans, everything else becomes a text")
      ->type_name("")
      ->check(CLI::Validator(keyValueProblem, ""));
  addIdentity(app, options.identity, texts, true);
}

void addSend(CLI::App& app, Options& options, Texts& texts) {
  CLI::App* send =
      addCommand(app, options, Command::send, "send", "Send one message in a session of its own");
  addMessage(*send, options, texts);
  addNumber(*send, "--flag", options.flag, "1: post at once, 2: regardless of sampling, 3: both, 0: neither")
      ->check(CLI::Validator(flagProblem, ""));
  send->add_option_function<std::string>(
          "--expect", [&options](const std::string&) { options.expectReported = true; },
          "reported: exit with status 1 unless a back end reports the message")
      ->type_name("WHAT")
      ->check(CLI::Validator(
          [](const std::string& text) {
            return text == "reported" ? std::string()
                                      : fmt::format("expected reported, found \"{}\"", escapedForLog(text));
          },
          ""));
  send->footer(
      "Says on standard error what each back end has done with the message, and why.\n\n"
      "Example:\n  veltractl send --client-type 7 --category 5 --type 1 codec=opus seconds=12.5");
}

void addOneShot(CLI::App& app, Options& options, Texts& texts) {
  CLI::App* oneShot =
      addCommand(app, options, Command::oneShot, "one-shot", "Send one message without starting a session");
  addMessage(*oneShot, options, texts);
  oneShot->footer(
      "Needs --client-type and --session-id. The reply is \"finished\", whether or not the message was\n"
      "reported, or \"storebag not available\".\n\n"
      "Example:\n  veltractl one-shot --client-type 7 --session-id 42 --category 5 --type 1 codec=opus");
}

void addQuestions(CLI::App& app, Options& options, Texts& texts) {
  CLI::App* states =
      addCommand(app, options, Command::states, "states", "Show which back ends report for a session");
  addIdentity(*states, options.identity, texts, false);
  states->footer("Example:\n  veltractl states --client-type 7 --client phone --service ringer");

  CLI::App* url = addCommand(app, options, Command::displayURL, "display-url",
                             "Show the address at which a session's reports can be viewed");
  addIdentity(*url, options.identity, texts, false);
  url->footer("Example:\n  veltractl display-url --client-type 7");
}

void addUploads(CLI::App& app, Options& options, Texts& texts) {
  CLI::App* file = addCommand(app, options, Command::upload, "upload", "Upload a file");
  addArgument(*file, "file", options.file, "A regular file; it is removed once the server has confirmed it");
  addIdentity(*file, options.identity, texts, true);
  file->footer(
      "Waits for the server and prints the result. The exit status is 1 if the file was not uploaded.\n\n"
      "Example:\n  veltractl upload --client-type 7 crash.log");
  CLI::App* logData =
      addCommand(app, options, Command::uploadLogData, "upload-log-data", "Upload an array of log data");
  addArgument(*logData, "file", options.file,
              "The array as JSON; {\"$date\": …} and {\"$data\": …} as in session");
  addIdentity(*logData, options.identity, texts, true);
  logData->footer(
      "Waits for the servers. The exit status is 1 if no server accepted the data.\n\n"
      "Example:\n  veltractl upload-log-data --client-type 7 logs.json");
}

void addGlobals(CLI::App& app, Options& options) {
  app.add_option("--root", options.root, "Directory that holds run/veltrad [VELTRA_ROOT, else /]")
      ->type_name("DIR")
      ->check(CLI::Validator(
          [](const std::string& text) { return text.empty() ? "expected a directory, found nothing" : ""; },
          ""));
  app.add_flag("--json", options.json,
               "Print status, stats and doctor as JSON; what opens a session always does");
  app.set_version_flag("--version", fmt::format("veltractl {}", veltra_version()), "Print the version");
  app.set_help_flag("-h,--help", "Print this help");
  app.require_subcommand(1);
  app.fallthrough();
  app.formatter(std::make_shared<Help>());
  app.footer(
      "Exit status: 0 success, 1 the daemon refused or failed, 2 usage error.\n"
      "For the options of a command, see `veltractl COMMAND --help`.\n\n"
      "Example:\n  veltractl send --client-type 7 --category 5 --type 1 codec=opus seconds=12.5");
}

// Replaces messages of CLI11 that say too little.
std::string problemOf(const CLI::App& app, const CLI::ParseError& error) {
  const std::vector<std::string> left = app.remaining(true);
  const bool noCommand = app.get_subcommands().empty();
  const auto code = static_cast<CLI::ExitCodes>(error.get_exit_code());
  const std::string first = left.empty() ? std::string() : escapedForLog(left[0]);
  if (code == CLI::ExitCodes::ExtrasError) return fmt::format("\"{}\" is not expected here", first);
  if (code != CLI::ExitCodes::RequiredError || !noCommand) return error.what();
  if (left.empty()) return fmt::format("no command: {}", kExpectedCommands);
  return fmt::format("unknown {} \"{}\": {}", first[0] == '-' ? "option" : "command", first,
                     kExpectedCommands);
}

// CLI11 also throws for help and version.
Ending endingOf(const CLI::App& app, const CLI::ParseError& error) {
  if (error.get_exit_code() != 0) {
    return Ending{kWrongUsage, "",
                  fmt::format("veltractl: {}\nSee veltractl --help.\n", problemOf(app, error))};
  }
  std::ostringstream output;
  app.exit(error, output, output);
  return Ending{0, output.str(), ""};
}

// To complete KEY of `config get KEY` and its like.
void offerPreferences(tools::CommandLine& line) {
  for (tools::Argument& argument : line.arguments) {
    if (argument.names[0] != "KEY") continue;
    for (const config::PreferenceKey& key : config::preferenceKeys()) argument.choices.push_back(key.name());
  }
  for (tools::CommandLine& command : line.commands) offerPreferences(command);
}

// The texts have been checked.
void putTogether(const Texts& texts, Options& options) {
  if (!texts.payload.empty()) options.payload = tools::parseKeyValues(texts.payload).value();
  if (!texts.client && !texts.service && texts.userInfo.empty()) return;
  Dictionary userInfo = tools::parseKeyValues(texts.userInfo).value();
  userInfo.setIfPresent(wire::kVeltraUserInfoClientName, texts.client);
  userInfo.setIfPresent(wire::kVeltraUserInfoServiceName, texts.service);
  options.identity.userInfo = std::move(userInfo);
}

void describe(CLI::App& app, Options& options, Texts& texts) {
  app.name("veltractl");
  app.description("Start veltrad sessions, send messages, upload files and see what happened to them.");
  addGlobals(app, options);
  addSession(app, options, texts);
  addSend(app, options, texts);
  addOneShot(app, options, texts);
  addQuestions(app, options, texts);
  addUploads(app, options, texts);
  addCare(app, options);
  addOwner(app, options);
}

}  // namespace

std::variant<Options, Ending> parseOptions(int argc, const char* const* argv) {
  Options options;
  Texts texts;
  CLI::App app;
  describe(app, options, texts);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return endingOf(app, error);
  }
  putTogether(texts, options);
  return options;
}

tools::CommandLine commandLine() {
  Options options;
  Texts texts;
  CLI::App app;
  describe(app, options, texts);
  tools::CommandLine line = tools::commandLineOf(app);
  offerPreferences(line);
  return line;
}

}  // namespace veltrad::ctl
