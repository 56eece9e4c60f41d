// SPDX-License-Identifier: Apache-2.0
// Downloads the storebag of a client type and selects the section of the process's environment.
#pragma once

#include "config/storebag_download.h"
#include "config/storebag_source.h"
#include "platform/limited_line.h"

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::config {

class OperatorSettings;
class StorebagStore;
class StorebagTrust;
struct Storebag;

// The section that devices of an environment use; null if there is none. Of "seed" without a section it is
// that of "release".
const Dictionary* sectionOf(const Storebag& storebag, std::uint32_t environment);

// The real source: downloads the storebag at each call, and keeps it on disk if the operator has chosen so.
// Makes no attempt until the operator's settings could be read once. Any number of threads at once, one for
// each storebag. The constructor's arguments must outlive it.
class StorebagSections final : public StorebagSource {
 public:
  StorebagSections(http::HTTPClient& http, ProcessSettings& settings, const support::Veltra& veltra,
                   StorebagTrust& trust, OperatorSettings& choices, StorebagStore& store,
                   platform::Counters& counters);

  StorebagSectionAnswer fetchStorebagForEnvironmentAndClientType(
      std::int32_t clientType, const std::optional<std::string>& lastModified) override;
  KeptSection keptStorebag(std::int32_t clientType) override;
  std::optional<std::string> whyNotUsed(const StorebagSection& section) override;
  double jitter() override;

 private:
  void refuse(std::int32_t clientType);

  ProcessSettings& _settings;
  StorebagDownload _download;
  StorebagTrust& _trust;
  OperatorSettings& _choices;
  StorebagStore& _store;
  platform::Counters& _counters;
  platform::LimitedLine _refusals{"storebags"};
};

}  // namespace veltrad::config
