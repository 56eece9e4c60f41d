// SPDX-License-Identifier: Apache-2.0
// Asks, and puts the answers into words.
#include "tools/ctl/privacy_command.h"

#include <fmt/format.h>

#include <cmath>

#include "base/text.h"
#include "formats/json.h"
#include "tools/ctl/control_client.h"
#include "tools/ctl/history_text.h"
#include "tools/ctl/print.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

namespace question = wire::question;

std::int64_t number(const Dictionary& from, const char* key) {
  const Value* value = from.find(key);
  return value ? value->toInt64().value_or(0) : 0;
}

std::string text(const Dictionary& from, const char* key) {
  const std::string* value = from.string(key);
  return value ? escapedForLog(*value) : std::string();
}

const Dictionary& dictionary(const Dictionary& from, const char* key) {
  static const Dictionary kNone;
  const Dictionary* value = from.dictionary(key);
  return value ? *value : kNone;
}

const Array& array(const Dictionary& from, const char* key) {
  static const Array kNone;
  const Array* value = from.array(key);
  return value ? *value : kNone;
}

// "3 events, 1 file"; empty: nothing.
std::string amounts(const Dictionary& of, std::initializer_list<const char*> keys) {
  std::string all;
  for (const char* key : keys) {
    const auto count = number(of, key);
    if (count == 0) continue;
    std::string name = std::string_view(key) == "logData" ? "log data" : key;
    if (count == 1 && name.ends_with('s')) name.pop_back();
    all += fmt::format("{}{} {}", all.empty() ? "" : ", ", count, name);
  }
  return all;
}

std::string orNothing(std::string text) {
  return text.empty() ? "nothing" : text;
}

std::string formatIdentifiers(const Dictionary& answer) {
  std::string out = "identifiers";
  for (const Value& one : array(answer, "identifiers")) {
    const Dictionary* identifier = one.asDictionary();
    if (!identifier) continue;
    const auto made = identifier->real("made");
    out += fmt::format("\n  {}  {}{}{}", text(*identifier, "name"), text(*identifier, "value"),
                       made && std::isfinite(*made) ? "  made " + timeText(*made) : "",
                       identifier->boolean("resettable").value_or(true) ? "" : "  given in device.plist");
  }
  return out;
}

std::string formatPrivacy(const Dictionary& answer) {
  const Value* consent = answer.find("consent");
  const Dictionary* policy = answer.dictionary("policy");
  const bool asked = consent && consent->isBoolean();
  std::string out = fmt::format(
      "reporting  {}\nconsent    {}\npolicy     {}\n{}\nleft in the last day", text(answer, "reporting"),
      !asked                  ? "never given"
      : *consent->toBoolean() ? "given"
                              : "refused",
      policy ? escapedForLog(formats::writeJSON(*policy)) : orNothing(text(answer, "policy")),
      formatIdentifiers(answer));
  for (const Value& one : array(answer, "destinations")) {
    const Dictionary* destination = one.asDictionary();
    if (!destination) continue;
    out += fmt::format("\n  to {}: {}, {} bytes", text(*destination, "to"),
                       orNothing(amounts(*destination, {"events", "datagrams", "files", "logData"})),
                       number(*destination, "bytes"));
  }
  return array(answer, "destinations").empty() ? out + "\n  nothing" : out;
}

std::string formatReceipt(const Dictionary& answer) {
  const Dictionary& dropped = dictionary(answer, "dropped");
  std::string out = "Reporting is off.\ndropped    " +
                    orNothing(amounts(dropped, {"events", "datagrams", "files", "posts"}));
  for (const Value& one : array(dropped, "byClient")) {
    const Dictionary* client = one.asDictionary();
    if (!client) continue;
    const std::string name = text(*client, "client"), service = text(*client, "service");
    out += fmt::format("\n  of {}, session {}: {}",
                       name.empty()      ? fmt::format("client type {}", number(*client, "clientType"))
                       : service.empty() ? name
                                         : name + "/" + service,
                       number(*client, "sessionID"), amounts(*client, {"events", "datagrams", "files"}));
  }
  const Dictionary& disk = dictionary(answer, "onDisk");
  return out + fmt::format(
                   "\nunder way  {}, which is ended within a second\n"
                   "on disk    message log {}, energy log {}, history {} bytes",
                   orNothing(amounts(dictionary(answer, "underWay"), {"posts", "events", "files"})),
                   number(disk, "messageLog"), number(disk, "energyLog"), number(disk, "history"));
}

std::string wordsOf(Command command, const Dictionary& answer) {
  switch (command) {
    case Command::privacyOff:
      return formatReceipt(answer);
    case Command::privacyOn:
      return text(answer, "reporting") == "on"
                 ? "Reporting is on."
                 : "Reporting stays off: etc/veltrad/policy.json says so, or it is broken.";
    case Command::privacyReset:
      return formatIdentifiers(answer);
    default:
      return formatPrivacy(answer);
  }
}

const char* questionOf(Command command) {
  switch (command) {
    case Command::privacyOff:
      return question::kTurnReportingOff;
    case Command::privacyOn:
      return question::kTurnReportingOn;
    case Command::privacyReset:
      return question::kResetIdentifiers;
    default:
      return question::kPrivacy;
  }
}

}  // namespace

int runPrivacy(const Options& options) {
  auto daemon = ControlClient::connect(options.root);
  const auto answer = daemon ? daemon.value().ask(questionOf(options.command))
                             : Result<Dictionary, std::string>(Failure{daemon.error()});
  if (!answer) {
    complain(answer.error());
    return 1;
  }
  const bool printed =
      printLine(options.json ? formats::writeJSON(answer.value()) : wordsOf(options.command, answer.value()));
  const bool staysOff = options.command == Command::privacyOn && text(answer.value(), "reporting") != "on";
  return printed && !staysOff ? 0 : 1;
}

}  // namespace veltrad::ctl
