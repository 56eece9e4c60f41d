// SPDX-License-Identifier: Apache-2.0
// The services of back ends in memory, so that tools can run the daemon's own code: nothing is read from the
// machine, and nothing leaves it.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "backends/standalone_services.h"
#include "config/daily_allowance.h"
#include "config/owner_gate.h"
#include "config/owner_policy.h"
#include "platform/device_properties.h"
#include "platform/device_secret.h"
#include "storebag/given.h"

namespace veltrad::storebag {

class MemoryFiles final : public platform::FileStore {
 public:
  Result<std::string, platform::FileFailure> read(const std::string& path, std::size_t most) override;
  Result<Done, platform::FileFailure> replace(const std::string& path, std::string_view bytes,
                                              unsigned mode) override;
  Result<Done, platform::FileFailure> rename(const std::string& from, const std::string& to) override;
  Result<Done, platform::FileFailure> unlink(const std::string& path) override;
  Result<platform::FileStamp, platform::FileFailure> stamp(const std::string& path) override;

 private:
  std::map<std::string, std::string> _files;
};

// Keeps the posts, which are never answered.
class KeptPosts final : public http::HTTPClient {
 public:
  struct Post {
    std::string url;
    std::string body;
  };
  Result<Done, http::HTTPError> start(http::HTTPRequest request, http::HTTPCompletion completion) override;
  http::HTTPResult perform(http::HTTPRequest request) override;
  std::vector<Post> take() { return std::exchange(_posts, {}); }

 private:
  std::vector<Post> _posts;
};

struct StandingClock final : platform::Clock {
  platform::TimeValue now() const override { return {}; }
};
struct GivenDraw final : platform::Random {
  explicit GivenDraw(double given) : draw(given) {}
  double uniform() override { return draw; }
  const double draw;
};
struct GivenLocale final : platform::Locale {
  explicit GivenLocale(std::optional<std::string> given) : country(std::move(given)) {}
  std::optional<std::string> countryCode() override { return country; }
  int timeZoneOffset() override { return 0; }
  const std::optional<std::string> country;
};
struct GivenDevice final : platform::DeviceProperties {
  explicit GivenDevice(Dictionary given) : properties(std::move(given)) {}
  platform::DeviceProperty value(std::string_view key) override;
  const Dictionary properties;
};

struct DryMachine {
  // For one back end of one session.
  DryMachine(const Given& given, const std::string& backend);

  MemoryFiles files;
  KeptPosts posts;
  StandingClock clock;
  GivenDraw random;
  GivenLocale locale;
  GivenDevice properties;
  platform::FilePreferences preferences{files, "/preferences"};
};

struct DryWorld : DryMachine, backends::StandaloneServices {
  DryWorld(const Given& given, const std::string& backend);

  config::OwnerPolicy policy{files, root.policyPath()};
  platform::DeviceSecret secret{files, root.secretPath()};
  config::DailyAllowance allowance{files, clock, root.allowancePath()};
  config::OwnerGate gate{policy, preferences, secret, allowance};
};

}  // namespace veltrad::storebag
