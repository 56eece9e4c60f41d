// Post addresses from the preferences and from client entries.
#include "backends/https/post_links.h"

#include "platform/log.h"
#include "platform/preferences.h"

namespace veltrad::backends {

PostLinks::PostLinks(platform::Preferences& preferences) {
  _postURL = preferences.text(platform::kVeltraPreferenceDomain, "httpsPostURL");
  if (_postURL)
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for postURL", _postURL->c_str());
  _useDefaultPostURL = _postURL.has_value();
  _realtimePostURL = preferences.text(platform::kVeltraPreferenceDomain, "httpsRealtimePostURL");
  if (_realtimePostURL) {
    logDebug("HTTPSPostBackend(initWithName): Using user default '%s' for realtimePostURL",
             _realtimePostURL->c_str());
  }
  _useDefaultRealtimePostURL = _realtimePostURL.has_value();
}

bool PostLinks::updatePostLink(const Dictionary& entry) {
  bool changed = false;
  if (!(_useDefaultPostURL && _postURL)) {
    _useDefaultPostURL = false;
    if (const std::string* url = entry.string("post_url")) {
      _postURL = *url;
      logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for postURL", url->c_str());
      changed = true;
    }
  }
  if (_useDefaultRealtimePostURL && _realtimePostURL) return changed;
  _useDefaultRealtimePostURL = false;
  if (const std::string* url = entry.string("realtime_post_url")) {
    _realtimePostURL = *url;
    logDebug("HTTPSPostBackend(updatePostLink): Storebag '%s' for realtimePostURL", url->c_str());
  } else {
    _realtimePostURL = _postURL;
    logDebug("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '%s'",
             _postURL ? _postURL->c_str() : "(null)");
  }
  return changed;
}

}  // namespace veltrad::backends
