// SPDX-License-Identifier: Apache-2.0
// Those who take the bodies of the door's requests and have the stream take what they hold.
#pragma once

#include <memory>

#include "gateway/door.h"

namespace veltrad::gateway {

// `charge` has what the body is charged at first.
// An envelope: 200 without a body.
std::unique_ptr<BodyTaker> takeEvents(const DoorServices& services, Wanted wanted, Charge charge);
// A gzip stream, which is handed on as it comes: 200 and {"success":true}.
std::unique_ptr<BodyTaker> takeFile(const DoorServices& services, Wanted wanted, Charge charge);
// A property list of an array: 200 and the place where it is said to be.
std::unique_ptr<BodyTaker> takeLogData(const DoorServices& services, Wanted wanted, Charge charge);

}  // namespace veltrad::gateway
