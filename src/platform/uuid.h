// Random UUIDs, version 4. Any thread.
#pragma once

#include <array>
#include <string>

namespace veltrad::platform {

std::array<unsigned char, 16> randomUUID();
// 36 characters, upper-case hexadecimal: "6F9619FF-8B86-4011-B42D-00CF4FC964FF".
std::string randomUUIDText();

}  // namespace veltrad::platform
