// SPDX-License-Identifier: Apache-2.0
// Counts how often each post came, by its X-VLT-Post-ID. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::lab {

class PostIDs {
 public:
  // True if it has come before.
  bool add(const std::string& id) {
    const Lock hold(_mutex);
    return ++_counts[id] > 1;
  }
  // {"ids": how many are known, "doubles": {ID: times}} of those that came more than once.
  Dictionary doubles() const {
    const Lock hold(_mutex);
    Dictionary doubles;
    for (const auto& [id, count] : _counts) {
      if (count > 1) doubles.set(id, count);
    }
    return {{"ids", _counts.size()}, {"doubles", std::move(doubles)}};
  }

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::uint64_t> _counts GUARDED_BY(_mutex);
};

}  // namespace veltrad::lab
