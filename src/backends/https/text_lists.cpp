// SPDX-License-Identifier: Apache-2.0
// Matches texts with lists.
#include "backends/https/text_lists.h"

#include <algorithm>

#include "base/text.h"

namespace veltrad::backends {

bool matchExactStringWithList(const std::vector<std::string>& list,
                              const std::optional<std::string>& wholeString, bool whitelist) {
  if (list.empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& item) { return equalIgnoringCase(item, *wholeString); });
}

bool matchStringWithList(const std::vector<std::string>& list, const std::optional<std::string>& wholeString,
                         bool whitelist) {
  if (list.empty()) return whitelist;
  if (!wholeString) return !whitelist;
  return std::any_of(list.begin(), list.end(),
                     [&](const std::string& item) { return containsIgnoringCase(*wholeString, item); });
}

bool matchClientNameAndServiceID(const config::ClientEntry& entry,
                                 const std::optional<std::string>& clientName,
                                 const std::optional<std::string>& serviceID) {
  return matchExactStringWithList(entry.client, clientName, true) &&
         matchStringWithList(entry.service, serviceID, true);
}

}  // namespace veltrad::backends
