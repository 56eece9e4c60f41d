// SPDX-License-Identifier: Apache-2.0
// XML property lists from anyone: what is read is written and read again as the same value, in both forms.
#include "formats/places.h"
#include "formats/property_list.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = formats::parseXMLPropertyList({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  static_cast<void>(formats::placesInXMLPropertyList({reinterpret_cast<const char*>(bytes), size}));
  fuzz::mustBe(read.value(), formats::parseXMLPropertyList(formats::writeXMLPropertyList(read.value())));
  fuzz::mustBe(read.value(), parseBinaryPropertyList(writeBinaryPropertyList(read.value())));
  return 0;
}
