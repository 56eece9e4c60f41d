// SPDX-License-Identifier: Apache-2.0
// A line of `veltractl session`: whatever it holds, the answer is a command or one line that says what is
// wrong.
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "formats/json.h"
#include "tools/ctl/answers.h"
#include "tools/ctl/session_lines.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace veltrad;
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const auto line = ctl::parseSessionLine(text);
  if (!line) {
    // The answer must itself be one line of JSON.
    const std::string answer = ctl::formatMalformedLine(1, line.error());
    if (answer.find('\n') != std::string::npos || !formats::parseJSON(answer).ok()) std::abort();
  } else if (ctl::isBlankLine(text) || line.value().duration > ctl::kLongestSleep) {
    std::abort();
  }
  return 0;
}
