// A locale that the test sets before it starts threads.
#pragma once

#include <optional>
#include <string>

#include "platform/locale.h"

namespace veltrad {

class FakeLocale final : public platform::Locale {
 public:
  std::optional<std::string> countryCode() override { return country; }
  int timeZoneOffset() override { return offset; }

  std::optional<std::string> country = "DE";
  int offset = 3'600;  // seconds east of GMT
};

}  // namespace veltrad
