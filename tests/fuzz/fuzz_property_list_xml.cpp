// XML property lists from anyone: what is read is written and read again as the same value, in both forms.
#include "base/property_list.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = parseXMLPropertyList({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  fuzz::mustBe(read.value(), parseXMLPropertyList(writeXMLPropertyList(read.value())));
  fuzz::mustBe(read.value(), parseBinaryPropertyList(writeBinaryPropertyList(read.value())));
  return 0;
}
