// SPDX-License-Identifier: Apache-2.0
// What to do about a storebag that a rule of the operator refuses. A plain function; any thread.
#pragma once

#include <string>

#include "wire/reasons.h"

namespace veltrad::daemon {

struct RefusalPlaces {
  std::string keysDirectory;
  std::string settings;  // the file
  std::string seen;      // the file that remembers serials and revocations
};

// One line. `reason`: of concern "storebag".
std::string adviceOn(wire::Reason reason, const RefusalPlaces& places);

// It is the signature that is refused, and not what the storebag says.
bool concernsSignature(wire::Reason reason);

}  // namespace veltrad::daemon
