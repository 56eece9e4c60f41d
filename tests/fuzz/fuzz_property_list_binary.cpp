// Binary property lists from anyone: what is read is written and read again as the same value.
#include <cstdlib>

#include "base/property_list.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = parseBinaryPropertyList({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  // Written out, shared objects are each their own: no limit that counted them at each place is passed.
  const auto again = parseBinaryPropertyList(writeBinaryPropertyList(read.value()));
  if (!again.ok() || !fuzz::same(read.value(), again.value())) std::abort();
  // XML has no word for all of it, but for every value a text that is read.
  PropertyListLimits wide;
  wide.textBytes *= 3;
  if (!parseXMLPropertyList(writeXMLPropertyList(read.value()), wide).ok()) std::abort();
  return 0;
}
