// SPDX-License-Identifier: Apache-2.0
// Decides which fields JSON can represent, and in which form.
#include "backends/https/json_fields.h"

#include <fmt/format.h>

#include <algorithm>
#include <cmath>

#include "base/text.h"
#include "formats/json.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
enum class Form { asItIs, seconds, none };

Form formOf(const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
    case Value::Type::signedInteger:
    case Value::Type::unsignedInteger:
    case Value::Type::string:
      return Form::asItIs;
    case Value::Type::real:
      return value.toDouble() ? Form::asItIs : Form::none;
    case Value::Type::date:
      return Form::seconds;
    case Value::Type::data:
    case Value::Type::array:
    case Value::Type::dictionary:
      return Form::none;
  }
  return Form::none;
}

// Limits the length of a log line.
constexpr std::size_t kMostPrinted = 1024;

std::string cut(const std::string& text) {
  if (text.size() <= kMostPrinted) return text;
  const std::string_view kept = withoutIncompleteEnd(std::string_view(text).substr(0, kMostPrinted));
  return fmt::format("{}… ({} bytes cut)", kept, text.size() - kept.size());
}

std::string printed(const Value& value) {
  if (const double* number = value.asReal()) return fmt::format("{}", *number);
  const formats::JSONExcerpt excerpt = formats::excerptOfJSON(value, kMostPrinted);
  return excerpt.leftOut == 0 ? excerpt.text
                              : fmt::format("{}… ({} bytes cut)", excerpt.text, excerpt.leftOut);
}

void sayUnable(const std::string& key, const Value& value) {
  logWarning("HTTPSPostBackend(createMessageForPostAndLogging): Quillfen unable to handle key: %s, value: %s",
             cut(key).c_str(), printed(value).c_str());
}
}  // namespace

double finiteOrMinusOne(double seconds) {
  return std::isfinite(seconds) ? seconds : -1.0;
}

bool fitsJSON(const Dictionary& event) {
  return std::all_of(event.begin(), event.end(),
                     [](const auto& entry) { return formOf(entry.second) == Form::asItIs; });
}

std::size_t restrictEventForJSON(Dictionary& event) {
  std::vector<Dictionary::Entry> changed;
  for (const auto& [key, value] : event) {
    const Form form = formOf(value);
    if (form == Form::asItIs) continue;
    if (form == Form::none) sayUnable(key, value);
    changed.emplace_back(key, value);
  }
  // Changes are applied after the loop, which they would invalidate.
  std::size_t removed = 0;
  for (auto& [key, value] : changed) {
    if (const Date* date = value.asDate()) {
      event.set(key, finiteOrMinusOne(date->secondsSince1970));
    } else {
      event.erase(key);
      ++removed;
    }
  }
  return removed;
}

bool writeField(formats::JSONTextWriter& writer, const std::string& key, const Value& value) {
  const Form form = formOf(value);
  if (form == Form::none) {
    sayUnable(key, value);
    return false;
  }
  writer.Key(key);
  if (form == Form::seconds) {
    writer.Double(finiteOrMinusOne(value.asDate()->secondsSince1970));
  } else {
    formats::putValue(writer, value);
  }
  return true;
}

}  // namespace veltrad::backends
