// SPDX-License-Identifier: Apache-2.0
// The path of the daemon's socket under the root directory, for both ends of the socket.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::wire {

// VELTRA_ROOT, or "/" if it is unset or empty.
std::string rootFromEnvironment();
// `relative` without a leading slash: pathUnder("/", "etc/veltrad/ca.pem").
std::string pathUnder(std::string root, std::string_view relative);
std::string socketPathUnder(std::string root);
std::string controlSocketPathUnder(std::string root);

}  // namespace veltrad::wire
