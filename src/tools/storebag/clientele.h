// SPDX-License-Identifier: Apache-2.0
// The clients that a client entry matches.
#pragma once

#include <set>
#include <string>
#include <vector>

#include "config/client_entry.h"

namespace veltrad::storebag {

// In lower case, each once.
using Names = std::set<std::string>;

Names lowered(const std::vector<std::string>& names);

struct Clientele {
  explicit Clientele(const config::ClientEntry& entry)
      : clients(lowered(entry.client)), services(lowered(entry.service)) {}

  bool operator==(const Clientele&) const = default;
  // Whether the entry matches every client of this name with a service that contains this text; null means
  // any.
  bool fits(const std::string* client, const std::string* service) const;

  // An empty list is everyone.
  Names clients;
  Names services;
};

}  // namespace veltrad::storebag
