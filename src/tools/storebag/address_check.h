// SPDX-License-Identifier: Apache-2.0
// Checks addresses to which events or datagrams are sent.
#pragma once

#include <optional>
#include <string>

#include "storebag/findings.h"

namespace veltrad::storebag {

struct AddressFault {
  FindingName name;
  // Follows the address: "has no host".
  std::string what;
  std::string mend;
};

// The fault of a post's address; absent if it is good.
std::optional<AddressFault> faultOfAddress(const std::string& address);
// The fault of a dashboard's address, which must be IPv4 in decimal.
std::optional<AddressFault> faultOfIPv4(const std::string& address);

}  // namespace veltrad::storebag
