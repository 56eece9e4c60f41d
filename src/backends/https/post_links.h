// SPDX-License-Identifier: Apache-2.0
// The URLs to which a back end posts: from the preferences, else from a client entry.
#pragma once

#include <optional>
#include <string>

#include "config/client_entry.h"
#include "platform/preferences.h"

namespace veltrad::backends {

class PostLinks {
 public:
  explicit PostLinks(platform::Preferences& preferences);

  // Returns whether the entry's "post_url" was used.
  bool updatePostLink(const config::ClientEntry& entry);
  const std::optional<std::string>& postURL() const { return _postURL; }
  const std::optional<std::string>& realtimePostURL() const { return _realtimePostURL; }

 private:
  std::optional<std::string> _postURL;
  std::optional<std::string> _realtimePostURL;
  // The URL is from the preferences, so no entry replaces it.
  const bool _useDefaultPostURL;
  const bool _useDefaultRealtimePostURL;
};

}  // namespace veltrad::backends
