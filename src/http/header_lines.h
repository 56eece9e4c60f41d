// SPDX-License-Identifier: Apache-2.0
// The header lines of a request. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "http/http_client.h"

namespace veltrad::http {

// As libcurl expects them: "name: value", "name;" for an empty value, and "name:" for a header that it would
// add otherwise. Without control characters, without names that are no token, and with the body's length.
std::vector<std::string> headerLines(const HTTPHeaders& headers, std::uint64_t bodySize);
// The lines of these that are sent, after the host's line.
std::vector<std::string> sentLines(const std::string& host, std::vector<std::string> lines);

}  // namespace veltrad::http
