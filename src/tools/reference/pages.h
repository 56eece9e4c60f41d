// SPDX-License-Identifier: Apache-2.0
// The reference pages, docs/reference/*.md. Each is written by hand except for its made parts, which stand
// between the lines "<!-- made: NAME -->" and "<!-- end -->".
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "base/result.h"

namespace veltrad::reference {

// A file that is generated completely.
struct MadeFile {
  const char* path;
  std::string (*make)();
};
std::span<const MadeFile> madeFiles();

// The page with each of its made parts replaced by what the program says now. The error names an unknown part
// or a missing end. `sources` is the directory of the source tree, from which examples and headers are taken.
Result<std::string, std::string> withMadeParts(std::string_view page, const std::string& sources);

}  // namespace veltrad::reference
