// SPDX-License-Identifier: Apache-2.0
// Generates the parts of manual pages about keys, client types and reasons.
#pragma once

#include <string>

#include "config/key_table.h"

namespace veltrad::reference {

// The keys of the table and of all tables inside it, each of these under a heading of its own.
std::string keysOf(const config::KeyTable& table);
// A table of the client types: number, storebag and sender code.
std::string preferences();
std::string clientTypes();
// A table of the environments: number and section.
std::string environments();
// The findings of lint: name, severity, meaning, correction.
std::string findings();
// The texts that veltractl stats shows, with their names.
std::string reasons();

}  // namespace veltrad::reference
