// SPDX-License-Identifier: Apache-2.0
// Whether events can be sent to an address.
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

// What is wrong with the address of a post; nothing: it is good.
std::optional<AddressFault> faultOfAddress(const std::string& address);
// Of a dashboard's address, IPv4 in decimal.
std::optional<AddressFault> faultOfIPv4(const std::string& address);

}  // namespace veltrad::storebag
