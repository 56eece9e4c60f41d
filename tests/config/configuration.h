// SPDX-License-Identifier: Apache-2.0
// A daemon's configuration in memory, a storebag server that answers as the test says, and a log.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "base/base64.h"
#include "config/operator_settings.h"
#include "config/process_settings.h"
#include "config/seen_storebags_file.h"
#include "config/storebag_store.h"
#include "config/storebag_trust.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/machine.h"
#include "fakes/recorded_log.h"
#include "formats/property_list.h"
#include "platform/counters.h"
#include "platform/root.h"
#include "rsa_key.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad {

// Lines that are to come while this lives, as "3 TEXT" with the level first; other warnings and errors fail
// the test.
using Lines = std::vector<std::string>;
struct ExpectedLog : RecordedLog {
  explicit ExpectedLog(const Lines& lines) {
    for (const std::string& line : lines) expectLine(Level(line[0] - '0'), line.substr(2));
  }
};

// A container around the bag bytes, signed with the shared key.
inline std::string container(const std::string& bag) {
  return formats::writeXMLPropertyList(
      Dictionary{{"signature", encodeBase64(RSAKey::shared().sign(bag))}, {"bag", encodeBase64(bag)}});
}

struct Configuration {
  explicit Configuration(int environment = 4) {
    preferences.set("environmentType", environment);
    preferences.set("veltra_storebag_url", "https://bags.test/x");
    files.put(root.publicKeyPath(), RSAKey::shared().encoded());
  }
  void answers(std::string body, http::HTTPHeaders headers) {
    answer = http::HTTPResponse{200, std::move(headers), std::move(body)};
  }

  platform::Root root{"/"};
  FakeDeviceProperties properties;
  support::DeviceIdentity device{properties};
  FakePreferences preferences;
  FakeFileStore files;
  config::ProcessSettings settings{preferences, device, files, root.deploymentPath()};
  support::Veltra veltra{files, preferences, root};
  FakeClock clock;
  platform::Counters counters;
  config::OperatorSettings choices{files, root.settingsPath()};
  config::StorebagStore store{files, clock, root.storebagsDirectory()};
  config::SeenStorebagsFile seen{files, root.seenStorebagsPath()};
  config::StorebagTrust trust{veltra, files, seen, clock, counters, root.keysDirectory()};
  http::HTTPResult answer =
      Failure{http::HTTPError{http::HTTPError::Kind::transport, "Could not resolve host: bags.test"}};
  FakeHTTPClient client{[this](http::HTTPRequest) { return answer; }};
};

}  // namespace veltrad
