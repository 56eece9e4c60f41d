// SPDX-License-Identifier: Apache-2.0
// The table of findings and its two forms of output.
#include "storebag/findings.h"

#include <fmt/format.h>

#include <algorithm>

namespace veltrad::storebag {
namespace {

std::string shown(std::string name) {
  std::replace(name.begin(), name.end(), '_', '-');
  return name;
}

}  // namespace

const char* textOf(Severity severity) {
  switch (severity) {
    case Severity::error:
      return "error";
    case Severity::warning:
      return "warning";
    case Severity::note:
      break;
  }
  return "note";
}

std::span<const FindingKind> findingKinds() {
  static const FindingKind kKinds[] = {
#define VELTRA_FINDING(name, severity, meaning, mend) \
  {FindingName::name, Severity::severity, shown(#name), meaning, mend},
#include "storebag/findings.def"
#undef VELTRA_FINDING
  };
  return kKinds;
}

const FindingKind& kindOf(FindingName name) {
  return findingKinds()[static_cast<std::size_t>(name)];
}

const FindingKind* findingKindNamed(std::string_view name) {
  const auto kinds = findingKinds();
  const auto at =
      std::find_if(kinds.begin(), kinds.end(), [name](const FindingKind& kind) { return kind.name == name; });
  return at == kinds.end() ? nullptr : &*at;
}

std::string lineOf(const std::string& file, const Finding& finding) {
  const FindingKind& kind = kindOf(finding.name);
  const std::string where = finding.path.empty() ? "" : finding.path + ": ";
  return fmt::format("{}:{}:{}: {}: {}{}. {} [{}]", file, finding.place.line, finding.place.column,
                     textOf(kind.severity), where, finding.message, finding.mend, kind.name);
}

Dictionary asDictionary(const std::string& file, const Finding& finding) {
  const FindingKind& kind = kindOf(finding.name);
  return {{"file", file},
          {"line", finding.place.line},
          {"column", finding.place.column},
          {"severity", textOf(kind.severity)},
          {"name", kind.name},
          {"path", finding.path},
          {"message", finding.message},
          {"mend", finding.mend}};
}

}  // namespace veltrad::storebag
