// JSON from anyone: what is read is written, in both styles, and read again as the same value.
#include "formats/json.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = formats::parseJSON({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  for (const formats::JSONStyle style : {formats::JSONStyle::compact, formats::JSONStyle::pretty})
    fuzz::mustBe(read.value(), formats::parseJSON(formats::writeJSON(read.value(), style)));
  return 0;
}
