// SPDX-License-Identifier: Apache-2.0
// The files of the spool: whatever the bytes are, what is read can be written and read again.
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "support/spool_entry.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace veltrad;
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  // The checksum rejects most inputs before the content is parsed.
  static_cast<void>(support::readSpoolEntry(bytes));
  if (const auto entry = support::readSpoolContent(bytes)) {
    const auto again = support::readSpoolEntry(support::writeSpoolEntry(*entry));
    if (!again || again->url != entry->url || again->body != entry->body || again->headers != entry->headers)
      std::abort();
  }
  return 0;
}
