// How names are held against lists of texts: letter case ignored. Plain functions; any thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "config/client_entry.h"

namespace veltrad::backends {

// Absent or empty list: `whitelist`. Absent text with a list: the opposite. Else whether an item equals the
// text.
bool matchExactStringWithList(const std::vector<std::string>& list,
                              const std::optional<std::string>& wholeString, bool whitelist);
// The same, but whether an item occurs inside the text.
bool matchStringWithList(const std::vector<std::string>& list, const std::optional<std::string>& wholeString,
                         bool whitelist);

// An entry's "client" (exact) and "service" (substring); an entry without both matches every client.
bool matchClientNameAndServiceID(const config::ClientEntry& entry,
                                 const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID);

}  // namespace veltrad::backends
