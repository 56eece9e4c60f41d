// SPDX-License-Identifier: Apache-2.0
// Random UUIDs, version 4.
#pragma once

#include <array>
#include <string>

namespace veltrad::platform {

std::array<unsigned char, 16> randomUUID();
// "6F9619FF-8B86-4011-B42D-00CF4FC964FF"
std::string randomUUIDText();

}  // namespace veltrad::platform
