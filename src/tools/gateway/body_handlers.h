// SPDX-License-Identifier: Apache-2.0
// Handlers for the bodies of devices' requests, which have the stream take what they hold.
#pragma once

#include <memory>

#include "gateway/request_router.h"

namespace veltrad::gateway {

// `charge` has what the body is charged at first.
// An envelope: 200 without a body.
std::unique_ptr<BodyHandler> handleEvents(const HandlerServices& services, ParsedRequest wanted,
                                          Charge charge);
// A gzip stream, which is handed on as it comes: 200 and {"success":true}.
std::unique_ptr<BodyHandler> handleFile(const HandlerServices& services, ParsedRequest wanted, Charge charge);
// A property list of an array: 200 and the place where it is said to be.
std::unique_ptr<BodyHandler> handleLogData(const HandlerServices& services, ParsedRequest wanted,
                                           Charge charge);

}  // namespace veltrad::gateway
