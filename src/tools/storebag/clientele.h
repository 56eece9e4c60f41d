// SPDX-License-Identifier: Apache-2.0
// Whom a client entry is for.
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
  // Whether the entry fits every client of this name with a service whose name holds this text; null: any.
  bool fits(const std::string* client, const std::string* service) const;

  // An empty list is everyone.
  Names clients;
  Names services;
};

}  // namespace veltrad::storebag
