// SPDX-License-Identifier: Apache-2.0
// The host of a URL. Any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace veltrad::http {

// The bytes of an address that are kept: longer than any resolvable name with scheme and port.
constexpr std::size_t kMostOfAddress = 300;

// The host that a request to this URL would contact, without port; empty if it names none. Uses libcurl's own
// parser, so that the checked host is always the contacted host.
std::string hostName(const std::string& url);
// Scheme, host and, where it is given, port, as the URL has them: "https://h.example:8443".
std::string_view addressOf(std::string_view url);
// The same without the scheme.
std::string_view authorityOf(std::string_view url);

}  // namespace veltrad::http
