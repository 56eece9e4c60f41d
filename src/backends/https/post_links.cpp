// SPDX-License-Identifier: Apache-2.0
// Reads post URLs from the preferences and from client entries.
#include "backends/https/post_links.h"

#include "config/preference_keys.h"
#include "platform/log.h"

namespace veltrad::backends {

PostLinks::PostLinks(platform::Preferences& preferences)
    : _postURL(preferences.text(platform::kVeltraPreferenceDomain, config::preference::kPostURL)),
      _realtimePostURL(
          preferences.text(platform::kVeltraPreferenceDomain, config::preference::kRealtimePostURL)),
      _useDefaultPostURL(_postURL),
      _useDefaultRealtimePostURL(_realtimePostURL) {
  if (_postURL)
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for postURL", _postURL->c_str());
  if (_realtimePostURL) {
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for realtimePostURL",
             _realtimePostURL->c_str());
  }
}

bool PostLinks::updatePostLink(const config::ClientEntry& entry) {
  const bool changed = !_useDefaultPostURL && entry.postURL;
  if (changed) {
    _postURL = entry.postURL;
    logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for postURL", _postURL->c_str());
  }
  if (_useDefaultRealtimePostURL) return changed;
  if (entry.realtimePostURL) {
    _realtimePostURL = entry.realtimePostURL;
    logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for realtimePostURL",
             _realtimePostURL->c_str());
  } else {
    _realtimePostURL = _postURL;
    logDebug("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '%s'",
             _postURL ? _postURL->c_str() : "(null)");
  }
  return changed;
}

}  // namespace veltrad::backends
