// SPDX-License-Identifier: Apache-2.0
// Reads the options of a session, also from an earlier version of their struct.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "veltra/veltra.h"

namespace veltrad::client {

// The struct of 8.0 ended after `undescribed`, and with padding, in which later fields lie now.
inline constexpr std::size_t kFieldsOf80 = offsetof(veltra_session_options, connect_later);
inline constexpr std::size_t kSizeOf80 =
    (kFieldsOf80 + alignof(veltra_session_options) - 1) & ~(alignof(veltra_session_options) - 1);

// The caller's options, with the default for each field that its version of the struct does not have. Absent
// if `size` is no version's size.
std::optional<veltra_session_options> completeOptions(const veltra_session_options* given);

// The fault in the description of a session, as a sentence; absent if there is none.
std::optional<std::string> problemOfDescription(const veltra_session_options& options);
// The same for a message's flag.
std::optional<std::string> problemOfFlag(std::uint32_t flag);

}  // namespace veltrad::client
