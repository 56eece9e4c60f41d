// SPDX-License-Identifier: Apache-2.0
// Runs another program and returns its output. One thread.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace veltrad::ctl {

// Standard output of a program that is looked for in PATH, at most `most` bytes. Nothing: it cannot be run,
// fails, or takes longer than `patience`.
std::optional<std::string> outputOf(const std::vector<std::string>& command, std::chrono::seconds patience,
                                    std::size_t most = 1u << 20);

}  // namespace veltrad::ctl
