// SPDX-License-Identifier: Apache-2.0
// The host of a URL. Any thread.
#pragma once

#include <string>

namespace veltrad::http {

// The host that a request to this URL would contact, without port; empty if it names none. By libcurl's own
// parser, so that nobody's idea of an address differs from where the request goes.
std::string hostName(const std::string& url);

}  // namespace veltrad::http
