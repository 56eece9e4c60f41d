// SPDX-License-Identifier: Apache-2.0
// Compares names regardless of letter case, as the daemon does.
#include "storebag/clientele.h"

#include <algorithm>

#include "base/text.h"

namespace veltrad::storebag {

Names lowered(const std::vector<std::string>& names) {
  Names all;
  for (const std::string& name : names) all.insert(lowerCase(name));
  return all;
}

bool Clientele::fits(const std::string* client, const std::string* service) const {
  if (!clients.empty() && (client == nullptr || !clients.contains(*client))) return false;
  if (services.empty()) return true;
  return service != nullptr && std::any_of(services.begin(), services.end(), [&](const std::string& own) {
           return service->find(own) != std::string::npos;
         });
}

}  // namespace veltrad::storebag
