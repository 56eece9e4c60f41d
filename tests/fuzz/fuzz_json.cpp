// SPDX-License-Identifier: Apache-2.0
// JSON from anyone: what is read is written, in both styles, and read again as the same value. Comments
// change nothing, and any place can be asked for.
#include "formats/json.h"
#include "formats/places.h"
#include "same_value.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  using namespace veltrad;
  const std::string_view text(reinterpret_cast<const char*>(bytes), size);
  const auto read = formats::parseJSONWithComments(text);
  const auto strict = formats::parseJSON(text);
  if (strict.ok()) fuzz::mustBe(strict.value(), read);
  if (!read.ok()) return 0;
  const formats::Places places = formats::placesInJSON(text);
  for (const auto& path : {std::vector<std::string>{"a"}, {"0", "0"}, {"a", "1", "b"}})
    static_cast<void>(places.at(path));
  for (const formats::JSONStyle style : {formats::JSONStyle::compact, formats::JSONStyle::pretty})
    fuzz::mustBe(read.value(), formats::parseJSON(formats::writeJSON(read.value(), style)));
  return 0;
}
