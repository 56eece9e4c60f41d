// SPDX-License-Identifier: Apache-2.0
// Binary property lists from anyone: what is read is written and read again as the same value.
#include "formats/property_list.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = parseBinaryPropertyList({reinterpret_cast<const char*>(bytes), size});
  // Whatever the bytes declare, no more memory is taken than the limit says.
  PropertyListLimits little;
  little.memory = 16u << 10;
  const auto small = parseBinaryPropertyList({reinterpret_cast<const char*>(bytes), size}, little);
  if (small.ok() && keptBytes(small.value()) > little.memory) std::abort();
  if (!read.ok()) return 0;
  // Written out, shared objects are each their own: no limit that counted them at each place is passed.
  fuzz::mustBe(read.value(), parseBinaryPropertyList(writeBinaryPropertyList(read.value())));
  // XML cannot represent all of it, but it has a readable text for every value.
  PropertyListLimits wide;
  wide.textBytes *= 3;
  if (!formats::parseXMLPropertyList(formats::writeXMLPropertyList(read.value()), wide).ok()) std::abort();
  return 0;
}
