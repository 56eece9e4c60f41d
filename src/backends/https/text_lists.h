// SPDX-License-Identifier: Apache-2.0
// Compares names with lists of texts, ignoring letter case.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "backends/client_match.h"
#include "config/client_entry.h"

namespace veltrad::backends {

// Returns whether an item equals the text; `whitelist` if the list is empty; `!whitelist` if the text is
// absent.
bool matchExactStringWithList(const std::vector<std::string>& list,
                              const std::optional<std::string>& wholeString, bool whitelist);
// The same, but an item matches if it occurs in the text.
bool matchStringWithList(const std::vector<std::string>& list, const std::optional<std::string>& wholeString,
                         bool whitelist);

// Compares an entry's "client" (exact) and "service" (substring). An entry without both matches every client.
bool matchClientNameAndServiceID(const config::ClientEntry& entry,
                                 const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID);

// None of the entries fits; the nearest is the first of those that lack least.
ClientMatch nearestClient(const std::vector<config::ClientEntry>& clients,
                          const std::optional<std::string>& clientName,
                          const std::optional<std::string>& serviceID);

}  // namespace veltrad::backends
