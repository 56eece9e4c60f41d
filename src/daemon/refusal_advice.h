// SPDX-License-Identifier: Apache-2.0
// The advice for a storebag that a rule of the operator refuses. Pure functions; any thread.
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

// True if the signature was refused, not the claims of the storebag.
bool concernsSignature(wire::Reason reason);

}  // namespace veltrad::daemon
