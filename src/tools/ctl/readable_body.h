// SPDX-License-Identifier: Apache-2.0
// The readable form of a body that left the device. A pure function; any thread.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::ctl {

// `kind`: "post", "datagram", "file" or "logData". Compressed bodies are unpacked; JSON and property lists
// are indented; a datagram is shown as the fields of its header and its text. Binary data is shown as
// hexadecimal digits, and only its first bytes.
std::string readableBody(std::string_view kind, std::string_view body);

}  // namespace veltrad::ctl
