// A daemon's configuration beside a storebag server that answers as the test says, both in memory.
#pragma once

#include <string>
#include <vector>

#include "base/base64.h"
#include "base/property_list.h"
#include "config/process_settings.h"
#include "fakes/fake_device_properties.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/fake_preferences.h"
#include "platform/root.h"
#include "protocol/veltra.h"
#include "rsa_key.h"
#include "support/device_identity.h"

namespace veltrad {

// Answers every request at once with the answer set last, and keeps the requests.
class StorebagServer {
 public:
  void isUnreachable() { _answer = FakeHTTPClient::transportError("Could not resolve host: bags.test"); }
  void answers(std::string body, platform::HTTPHeaders headers = {}, int status = 200) {
    _answer = FakeHTTPClient::response(status, std::move(body), std::move(headers));
  }
  // Of the calls that have returned.
  const std::vector<platform::HTTPRequest>& requests() const { return _requests; }

 private:
  platform::HTTPResult _answer = FakeHTTPClient::response(200);
  std::vector<platform::HTTPRequest> _requests;

 public:
  // Last, so that its thread ends first.
  FakeHTTPClient client{[this](const platform::HTTPRequest& request) {
    _requests.push_back(request);
    return _answer;
  }};
};

// A container around the bag bytes, signed with the shared key.
inline std::string container(const std::string& bag) {
  return writeXMLPropertyList(
      Dictionary{{"signature", encodeBase64(RSAKey::shared().sign(bag))}, {"bag", encodeBase64(bag)}});
}
inline std::string container(const Dictionary& storebag) {
  return container(writeXMLPropertyList(storebag));
}

struct Configuration {
  explicit Configuration(int environment = 4) {
    preferences.set("environmentType", environment);
    preferences.set("veltra_storebag_url", "https://bags.test/x");
    files.put(root.publicKeyPath(), RSAKey::shared().subjectPublicKeyInfo());
  }
  platform::Root root{"/"};
  fakes::FakeDeviceProperties properties;
  DeviceIdentity device{properties};
  fakes::FakePreferences preferences;
  fakes::FakeFileStore files;
  ProcessSettings settings{preferences, device, files, root.deploymentPath()};
  Veltra veltra{files, preferences, root};
  StorebagServer server;
};

}  // namespace veltrad
