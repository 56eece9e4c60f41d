// JSON from anyone: what is read is written, in both styles, and read again as the same value.
#include "base/json.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const auto read = parseJSON({reinterpret_cast<const char*>(bytes), size});
  if (!read.ok()) return 0;
  for (const JSONStyle style : {JSONStyle::compact, JSONStyle::pretty})
    fuzz::mustBe(read.value(), parseJSON(writeJSON(read.value(), style)));
  return 0;
}
