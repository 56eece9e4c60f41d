// XML property lists from anyone: what is read is written and read again as the same value, in both forms.
#include <cstdlib>

#include "base/property_list.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = parseXMLPropertyList({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  const auto again = parseXMLPropertyList(writeXMLPropertyList(read.value()));
  if (!again.ok() || !fuzz::same(read.value(), again.value())) std::abort();
  const auto binary = parseBinaryPropertyList(writeBinaryPropertyList(read.value()));
  if (!binary.ok() || !fuzz::same(read.value(), binary.value())) std::abort();
  return 0;
}
