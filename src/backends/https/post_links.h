// Where a back end's events are posted to: as the preferences say, else as a client entry does. Its owner's
// thread.
#pragma once

#include <optional>
#include <string>

#include "config/client_entry.h"

namespace veltrad::platform {
class Preferences;
}  // namespace veltrad::platform

namespace veltrad::backends {

class PostLinks {
 public:
  explicit PostLinks(platform::Preferences& preferences);

  // True when the entry's "post_url" was taken.
  bool updatePostLink(const config::ClientEntry& entry);
  const std::optional<std::string>& postURL() const { return _postURL; }
  const std::optional<std::string>& realtimePostURL() const { return _realtimePostURL; }

 private:
  std::optional<std::string> _postURL;
  std::optional<std::string> _realtimePostURL;
  // From the preferences, so that no entry replaces it.
  const bool _useDefaultPostURL;
  const bool _useDefaultRealtimePostURL;
};

}  // namespace veltrad::backends
