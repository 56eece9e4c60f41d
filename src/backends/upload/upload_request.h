// The request that carries a file. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "http/http_client.h"

namespace veltrad::backends {

// What stands behind the last slash; slashes at the end do not count. "/" of the root.
std::string_view lastPathComponent(std::string_view path);

// The post of a gzipped file, but for its body. Nothing: `uploadURL` and the rest make no URL.
std::optional<http::HTTPRequest> uploadRequest(const std::string& uploadURL, const std::string& udid,
                                               std::uint32_t sessionID, std::string_view path);

}  // namespace veltrad::backends
