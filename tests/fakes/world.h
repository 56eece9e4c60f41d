// SPDX-License-Identifier: Apache-2.0
// All fake services, and the real objects that use them, for tests of back ends and above.
#pragma once

#include "backends/standalone_services.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/machine.h"

namespace veltrad {

struct FakeMachine {
  FakeHTTPClient http;
  FakeClock clock;
  FakeRandom random;
  FakeLocale locale;
  FakePreferences preferences;
  FakeDeviceProperties properties;
  FakeFileStore files;
};

struct World : FakeMachine, backends::StandaloneServices {
  World() : StandaloneServices({http, clock, random, locale, preferences, properties, files}) {}
};

}  // namespace veltrad
