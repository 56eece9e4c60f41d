// SPDX-License-Identifier: Apache-2.0
// Handlers for the bodies of devices' requests, which have the stream take what they hold.
#pragma once

#include <memory>

#include "gateway/request_router.h"

namespace veltrad::gateway {

// `charge` has what the body is charged at first. Of events the body is an envelope, answered 200 without a
// body; of an upload a gzip stream, which is handed on as it comes, answered {"success":true}; of log data a
// property list of an array, answered the place where it is said to be.
std::unique_ptr<BodyHandler> handlerFor(const HandlerServices& services, ParsedRequest request,
                                        Charge charge);

}  // namespace veltrad::gateway
