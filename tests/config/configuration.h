// A daemon's configuration in memory, beside a storebag server that answers as the test says, and its log.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "base/base64.h"
#include "base/property_list.h"
#include "config/process_settings.h"
#include "fakes/fake_device_properties.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/fake_preferences.h"
#include "platform/log.h"
#include "platform/root.h"
#include "protocol/veltra.h"
#include "rsa_key.h"
#include "support/device_identity.h"

namespace veltrad {

using Lines = std::vector<std::string>;

// Every line up to `most` for as long as this lives, as "3 TEXT". One at a time.
class LogLines {
 public:
  explicit LogLines(platform::LogLevel most = platform::LogLevel::debug)
      : _before(platform::log::threshold.exchange(static_cast<int>(most))) {
    platform::log::setSink([this](platform::LogLevel level, std::string_view line) {
      _lines.push_back(std::to_string(static_cast<int>(level)) + " " + std::string(line));
    });
  }
  ~LogLines() {
    platform::log::setSink({});
    platform::log::threshold = _before;
  }
  Lines take() { return std::exchange(_lines, {}); }

 private:
  const int _before;
  Lines _lines;
};

// A container around the bag bytes, signed with the shared key.
inline std::string container(const std::string& bag) {
  return writeXMLPropertyList(
      Dictionary{{"signature", encodeBase64(RSAKey::shared().sign(bag))}, {"bag", encodeBase64(bag)}});
}

struct Configuration {
  explicit Configuration(int environment = 4) {
    preferences.set("environmentType", environment);
    preferences.set("veltra_storebag_url", "https://bags.test/x");
    files.put(root.publicKeyPath(), RSAKey::shared().encoded());
  }
  void answers(std::string body, platform::HTTPHeaders headers = {}, int status = 200) {
    answer = FakeHTTPClient::response(status, std::move(body), std::move(headers));
  }

  platform::Root root{"/"};
  fakes::FakeDeviceProperties properties;
  DeviceIdentity device{properties};
  fakes::FakePreferences preferences;
  fakes::FakeFileStore files;
  ProcessSettings settings{preferences, device, files, root.deploymentPath()};
  Veltra veltra{files, preferences, root};
  platform::HTTPResult answer = FakeHTTPClient::transportError("Could not resolve host: bags.test");
  std::vector<platform::HTTPRequest> requests;  // those that were answered
  // Last, so that its thread ends first.
  FakeHTTPClient client{[this](const platform::HTTPRequest& request) {
    requests.push_back(request);
    return answer;
  }};
};

}  // namespace veltrad
