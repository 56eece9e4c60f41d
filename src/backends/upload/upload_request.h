// SPDX-License-Identifier: Apache-2.0
// Makes the request that posts a file.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "http/http_client.h"

namespace veltrad::backends {

// The part after the last slash, not counting slashes at the end. "/" for the root.
std::string_view lastPathComponent(std::string_view path);

// The request for a gzipped file, without its body. Nothing if the URL would not be valid.
std::optional<http::HTTPRequest> uploadRequest(const std::string& uploadURL, const std::string& udid,
                                               std::uint32_t sessionID, std::string_view path);

}  // namespace veltrad::backends
