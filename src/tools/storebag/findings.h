// SPDX-License-Identifier: Apache-2.0
// The findings of lint, and their text.
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "base/text.h"
#include "base/value.h"

namespace veltrad::storebag {

enum class FindingName {
#define VELTRA_FINDING(name, severity, meaning, mend) name,
#include "storebag/findings.def"
#undef VELTRA_FINDING
};

enum class Severity { error, warning, note };
const char* textOf(Severity severity);

struct FindingKind {
  FindingName id;
  Severity severity;
  // As users see it: "unknown-key".
  std::string name;
  const char* meaning;
  const char* mend;
};
// All kinds of findings, in the order of their names above.
std::span<const FindingKind> findingKinds();
const FindingKind& kindOf(FindingName name);
// Null if there is no such name.
const FindingKind* findingKindNamed(std::string_view name);

struct Finding {
  FindingName name;
  TextPlace place;
  // "release.httppost.clients[0].post_url"; empty at the top.
  std::string path;
  // No full stop at the end.
  std::string message;
  // A sentence.
  std::string mend;
};

// "FILE:LINE:COLUMN: SEVERITY: TEXT [NAME]"
std::string lineOf(const std::string& file, const Finding& finding);
Dictionary asDictionary(const std::string& file, const Finding& finding);

}  // namespace veltrad::storebag
