// SPDX-License-Identifier: Apache-2.0
// Writes answers as JSON.
#include "tools/ctl/answers.h"

#include <fmt/format.h>

#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "wire/fates.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace key = wire::key;

namespace {

std::string jsonString(std::string_view text) {
  return formats::writeJSON(Value(text));
}

template <typename T>
std::string jsonOrNull(const std::optional<T>& value) {
  return value ? formats::writeJSON(Value(*value)) : "null";
}

std::string formatError(const std::optional<wire::ReportingError>& error) {
  if (!error) return "null";
  return fmt::format(R"({{"domain":{},"code":{},"description":{}}})", jsonString(error->domain), error->code,
                     jsonString(error->description));
}

template <typename Use>
void forEachOutcome(const Answer& answer, Use use) {
  if (!answer.outcomes) return;
  for (const Value& outcome : *answer.outcomes) {
    if (const Dictionary* dictionary = outcome.asDictionary()) use(*dictionary);
  }
}

}  // namespace

Answer answerOfFailure(veltra_status status) {
  Answer answer;
  answer.status = status;
  answer.error = wire::makeReportingError(veltra_status_text(status), -1);
  return answer;
}

std::string formatAnswer(Operation operation, const Answer& answer) {
  std::string text = fmt::format(R"({{"op":"{}")", operationName(operation));
  switch (operation) {
    case Operation::start:
    case Operation::restart:
    case Operation::states:
      text += ",\"backends\":" + jsonOrNull(answer.backends);
      break;
    case Operation::send:
    case Operation::oneShot:
    case Operation::flush:
    case Operation::displayURL:
    case Operation::finish:
      text += ",\"reply\":" + jsonOrNull(answer.reply);
      break;
    case Operation::uploadFile:
    case Operation::uploadLogData:
      text += answer.uploaded ? ",\"uploaded\":true" : ",\"uploaded\":false";
      break;
    case Operation::sleep:
      break;
  }
  const bool alwaysWithError = operation == Operation::flush || operation == Operation::uploadLogData;
  if (alwaysWithError || answer.status != VELTRA_OK) text += ",\"error\":" + formatError(answer.error);
  return text + '}';
}

std::string formatSent(const Answer& answer) {
  std::string text = formatAnswer(Operation::send, answer);
  text.pop_back();
  return text + ",\"outcomes\":" + jsonOrNull(answer.outcomes) + '}';
}

std::vector<std::string> outcomeLines(const Answer& answer) {
  std::vector<std::string> lines;
  forEachOutcome(answer, [&](const Dictionary& outcome) {
    lines.push_back(fmt::format("{}: {}: {} ({})", textIn(outcome, key::kBackend),
                                textIn(outcome, key::kOutcome), textIn(outcome, key::kText),
                                textIn(outcome, key::kReason)));
  });
  return lines;
}

bool reported(const Answer& answer) {
  constexpr wire::Fate kReported[] = {wire::Fate::batched, wire::Fate::posted,  wire::Fate::waiting,
                                      wire::Fate::sent,    wire::Fate::written, wire::Fate::delivered};
  bool found = false;
  forEachOutcome(answer, [&](const Dictionary& outcome) {
    const std::string fate = textIn(outcome, key::kOutcome);
    for (const wire::Fate one : kReported) found |= fate == wire::nameOf(one);
  });
  return found;
}

std::string formatAggregated(const AggregatedCopy& copy) {
  return fmt::format(
      R"({{"op":"aggregated","sessionInfo":{},"timestamp":{},"category":{},"type":{},"payload":{}}})",
      jsonOrNull(copy.sessionInfo), formats::writeJSON(copy.timestamp), copy.category, copy.type,
      jsonOrNull(copy.payload));
}

std::string formatMalformedLine(std::uint64_t line, std::string_view description) {
  return fmt::format(R"({{"op":"error","line":{},"description":{}}})", line, jsonString(description));
}

}  // namespace veltrad::ctl
