// SPDX-License-Identifier: Apache-2.0
// What left, as a person reads it. A plain function; any thread.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::ctl {

// `kind`: "post", "datagram", "file" or "logData". What is compressed is unpacked; JSON and property lists
// are laid out; of a datagram, the fields of its header and its text. What is no text is shown as hexadecimal
// digits, and only its first bytes.
std::string readableBody(std::string_view kind, std::string_view body);

}  // namespace veltrad::ctl
