// SPDX-License-Identifier: Apache-2.0
// Shows and changes the preferences that the system reads. Any thread.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"
#include "config/preference_keys.h"
#include "support/device_identity.h"

namespace veltrad::platform {
class DeviceProperties;
class FilePreferences;
}  // namespace veltrad::platform

namespace veltrad::config {

// Answers as the control socket carries them, or one line that says what is wrong. The constructor's
// arguments must outlive it.
class PreferenceEditor {
 public:
  using Answer = Result<Dictionary, std::string>;

  PreferenceEditor(platform::FilePreferences& preferences, platform::DeviceProperties& device)
      : _preferences(preferences), _device(device) {}

  // {"keys": [{"name", "domain", "type", "value", "default", "effect"}]}. A missing value or default is NaN.
  Answer list();
  // {"name", "value": the text that a person wrote}. Answers {}.
  Answer set(const Dictionary& arguments);
  // {"name"}. Answers {"wasSet"}.
  Answer unset(const Dictionary& arguments);

 private:
  Result<std::optional<Value>, std::string> stored(const PreferenceKey& key);

  platform::FilePreferences& _preferences;
  support::DeviceIdentity _device;
};

}  // namespace veltrad::config
