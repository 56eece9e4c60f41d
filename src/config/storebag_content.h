// SPDX-License-Identifier: Apache-2.0
// A parsed storebag: its top level, the section of an environment, and the entries of back ends. Immutable
// and shared by sessions.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "config/client_entry.h"
#include "config/key_table.h"

namespace veltrad::config {

// The entry of "httppost" or "httppost2".
struct HTTPSPostProfile {
  std::optional<std::vector<ClientEntry>> clients;
  std::optional<std::string> displayURL;

  bool operator==(const HTTPSPostProfile&) const = default;
  static const KeyTable kKeys;
};

// The key "reliable", which switches acknowledgements on with any value.
struct Reliable {
  bool on = false;
  std::int32_t milliseconds = 0;

  bool operator==(const Reliable&) const = default;
};
void take(const Key& key, const Value& value, Reliable& field);

// The entry of "dashboard".
struct DashboardProfile {
  std::optional<std::string> ip;
  std::optional<std::uint16_t> port;
  std::optional<std::string> displayURL;
  std::optional<std::string> postURL;
  Reliable reliable;

  bool operator==(const DashboardProfile&) const = default;
  static const KeyTable kKeys;
};

// The entry of "uploadserver".
struct UploadProfile {
  std::optional<std::string> postURL;
  std::optional<std::string> displayURL;

  bool operator==(const UploadProfile&) const = default;
  static const KeyTable kKeys;
};

using Profile = std::variant<HTTPSPostProfile, DashboardProfile, UploadProfile>;

// The origin of a section, for administrators.
struct StorebagOrigin {
  std::string name;                    // of the storebag
  std::optional<std::string> version;  // which it need not have
  std::string section;
  std::optional<std::string> expires = {};  // as given
};

// The back ends of one environment.
struct StorebagSection {
  StorebagOrigin origin;
  Dictionary asGiven;
  // All entries by name. Null if the back end is unknown or its entry is not read.
  std::map<std::string, std::shared_ptr<const Profile>> backends;

  static const KeyTable kKeys;
};

std::shared_ptr<const StorebagSection> parseSection(const Dictionary& section, StorebagOrigin origin = {});

struct Storebag {
  std::optional<Dictionary> development;
  std::optional<Dictionary> flornInternal;
  std::optional<Dictionary> seed;
  std::optional<Dictionary> release;
  std::optional<std::string> version;
  // In seconds, within 32 bits.
  std::optional<std::int64_t> refreshCycle;
  // For StorebagClaims.
  std::optional<std::int64_t> serial;
  std::optional<std::string> expires;
  std::optional<std::string> name;

  bool operator==(const Storebag&) const = default;
  static const KeyTable kKeys;
};

}  // namespace veltrad::config
