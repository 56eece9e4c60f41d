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

ClientMatch nearestClient(const std::vector<config::ClientEntry>& clients,
                          const std::optional<std::string>& clientName,
                          const std::optional<std::string>& serviceID) {
  ClientMatch nearest;
  for (std::size_t i = 0; i < clients.size(); ++i) {
    const bool client = !matchExactStringWithList(clients[i].client, clientName, true);
    const bool service = !matchStringWithList(clients[i].service, serviceID, true);
    if (!nearest.nearest || (!client || !service) > (!nearest.clientDiffers || !nearest.serviceDiffers))
      nearest = {std::nullopt, i, client, service};
  }
  return nearest;
}

}  // namespace veltrad::backends
