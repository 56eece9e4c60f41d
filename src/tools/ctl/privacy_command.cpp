// SPDX-License-Identifier: Apache-2.0
// `veltractl privacy`: asks, and puts the answers into words.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>
#include <iterator>

#include "base/text.h"
#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/history_text.h"
#include "tools/ctl/print.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

namespace question = wire::question;

const Dictionary& dictionary(const Dictionary& from, const char* key) {
  static const Dictionary kNone;
  const Dictionary* value = from.dictionary(key);
  return value ? *value : kNone;
}

// "3 events, 1 file"; empty: nothing.
std::string amounts(const Dictionary& of, std::initializer_list<const char*> keys) {
  std::string all;
  for (const char* key : keys) {
    const auto count = numberIn(of, key);
    if (count == 0) continue;
    std::string name = std::string_view(key) == "logData" ? "log data" : key;
    if (count == 1 && name.ends_with('s')) name.pop_back();
    all += fmt::format("{}{} {}", all.empty() ? "" : ", ", count, name);
  }
  return all;
}

std::string orNothing(const std::string& text) {
  return text.empty() ? "nothing" : text;
}

std::string formatIdentifiers(const Dictionary& answer) {
  std::string out = "identifiers";
  for (const Dictionary* identifier : dictionariesIn(answer, "identifiers")) {
    const auto made = identifier->real("made");
    out += fmt::format("\n  {:<16} {}{}{}", textIn(*identifier, "name"), textIn(*identifier, "value"),
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
      "reporting  {}\nconsent    {}\npolicy     {}\n{}\nleft in the last day", textIn(answer, "reporting"),
      !asked                  ? "never given"
      : *consent->toBoolean() ? "given"
                              : "refused",
      policy ? escapedForLog(formats::writeJSON(*policy)) : orNothing(textIn(answer, "policy")),
      formatIdentifiers(answer));
  const auto destinations = dictionariesIn(answer, "destinations");
  for (const Dictionary* destination : destinations)
    out += fmt::format("\n  to {}: {}, {} bytes", textIn(*destination, "to"),
                       orNothing(amounts(*destination, {"events", "datagrams", "files", "logData"})),
                       numberIn(*destination, "bytes"));
  return destinations.empty() ? out + "\n  nothing" : out;
}

std::string formatReceipt(const Dictionary& answer) {
  const Dictionary& dropped = dictionary(answer, "dropped");
  std::string out = "Reporting is off.\ndropped    " +
                    orNothing(amounts(dropped, {"events", "datagrams", "files", "posts"}));
  for (const Dictionary* client : dictionariesIn(dropped, "byClient")) {
    const std::string name = textIn(*client, "client"), service = textIn(*client, "service");
    const std::string who = name.empty() ? fmt::format("client type {}", numberIn(*client, "clientType"))
                                         : fmt::format("{}{}{}", name, service.empty() ? "" : "/", service);
    out += fmt::format("\n  of {}, session {}: {}", who, numberIn(*client, "sessionID"),
                       amounts(*client, {"events", "datagrams", "files"}));
  }
  const std::string begun = amounts(dictionary(answer, "underWay"), {"posts", "events", "files"});
  const Dictionary& disk = dictionary(answer, "onDisk");
  return out + fmt::format(
                   "\nunder way  {}\n"
                   "on disk    message log {}, energy log {}, history {} bytes",
                   begun.empty() ? "nothing" : begun + ": ended within a second",
                   numberIn(disk, "messageLog"), numberIn(disk, "energyLog"), numberIn(disk, "history"));
}

std::string formatOn(const Dictionary& answer) {
  return textIn(answer, "reporting") == "on"
             ? "Reporting is on."
             : "Reporting stays off: etc/veltrad/policy.json says so, or it is broken.";
}

struct Question {
  Command command;
  const char* name;
  std::string (*words)(const Dictionary& answer);
};
constexpr Question kQuestions[] = {
    {Command::privacy, question::kPrivacy, formatPrivacy},
    {Command::privacyOff, question::kTurnReportingOff, formatReceipt},
    {Command::privacyOn, question::kTurnReportingOn, formatOn},
    {Command::privacyReset, question::kResetIdentifiers, formatIdentifiers},
};

}  // namespace

int runPrivacy(ControlClient& daemon, const Options& options) {
  const auto* asked = std::find_if(std::begin(kQuestions), std::end(kQuestions),
                                   [&](const Question& one) { return one.command == options.command; });
  const auto answer = daemon.ask(asked->name);
  if (!answer) return refused(answer.error());
  const int status =
      printed(options.json ? formats::writeJSON(answer.value()) : asked->words(answer.value()));
  const bool staysOff = options.command == Command::privacyOn && textIn(answer.value(), "reporting") != "on";
  return staysOff ? 1 : status;
}

}  // namespace veltrad::ctl
